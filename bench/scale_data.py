#!/usr/bin/env python3
"""Seeded data for the scale benchmark (bench/scale), standard library only.

  scale_data.py records --size S|L --photos DIR --out DIR [--seed N]
      writes, as typed JSON lines for `tessel records put`:
        DIR/contacts.jsonl   contacts with phones, e-mails, addresses, URLs, IMs, 25 groups
                             (members, and each contact's parent groups, as the vCard importer
                             writes them) and a photo on every tenth contact (the pictures of
                             DIR, made by scale_photos)
        DIR/calendars.jsonl  events in 20 calendars of Zipf-like sizes, with recurrence rules,
                             exception dates, detached occurrences, alarms, organizers and
                             attendees; named-zone, UTC, floating and whole-day dates; the
                             calendar order record
        DIR/change.jsonl     one contact again, with one attribute changed
      L = 50,000 contacts, 5,000 photos, 100,000 events; S = a tenth of each.
  scale_data.py ics --events N --out FILE.ics [--seed N]
      writes one calendar of N events of the same kinds as an iCalendar file.

The same arguments give the same bytes.
"""
import argparse
import base64
import datetime
import json
import os
import random

SIZES = {
    "L": {"contacts": 50_000, "photos": 5_000, "events": 100_000},
    "S": {"contacts": 5_000, "photos": 500, "events": 10_000},
}
GROUPS = 25
CALENDARS = 20

FIRST = ["Anna", "Zoë", "Jürgen", "Łukasz", "Søren", "José", "Chloé", "Ørjan", "Åsa", "Ünal",
         "Maria", "John", "Émile", "Nuño", "Dvořák", "Ærin", "Ğülşen", "Дмитрий", "Αλέξης",
         "Yuki", "山田", "Li", "François", "Renée", "Mark", "Sarah", "Olivier", "Bjørn", "Ines",
         "Paweł", "Tomás", "Siobhán", "Ahmed", "Priya", "Kateřina", "Zoltán", "Hana", "Noël"]
LAST = ["Müller", "Smith", "García", "Nowak", "Øster", "Lefèvre", "Kovács", "Andersson",
        "Öztürk", "Brown", "Rossi", "Dubois", "Schröder", "Peña", "Čapek", "Nguyễn", "Иванов",
        "Παπαδόπουλος", "田中", "Wang", "O'Brien", "Fernández", "Jensen", "Weiß", "Håkansson",
        "Kowalczyk", "Lambert", "Moreau", "Sánchez", "Virtanen", "Yılmaz", "Ng", "Kim"]
COMPANIES = ["Kestro Computer", "Acme Ltd", "Société Générale de Café", "Bäckerei Groß",
             "Northwind", "Umbrella", "Initech", "Blue Sky Ünlimited", "Østfold Energi", ""]
JOBS = ["Engineer", "Manager", "Designer", "Chef de projet", "Geschäftsführer", "Nurse",
        "Teacher", "Sales", "Accountant", ""]
STREETS = ["Hauptstraße", "Rue de la Paix", "Main Street", "Calle Mayor", "Storgatan",
           "Via Roma", "Ulica Długa", "Elm Avenue", "Kongens Gade", "Ringvägen"]
CITIES = [("Berlin", "", "Germany"), ("Paris", "", "France"), ("Springfield", "IL", "USA"),
          ("Madrid", "", "Spain"), ("Malmö", "", "Sweden"), ("Kraków", "", "Poland"),
          ("Zürich", "ZH", "Switzerland"), ("Toronto", "ON", "Canada"),
          ("København", "", "Denmark"), ("São Paulo", "SP", "Brazil")]
PHONE_TYPES = ["home", "work", "mobile", "main", "home fax", "work fax", "pager", "other"]
KINDS = ["home", "work", "other"]
GROUP_NAMES = ["Family", "Friends", "Work", "Football club", "Chorale Sainte-Cécile",
               "Neighbours", "School parents", "Book club", "Doctors", "Suppliers",
               "Clients Nord", "Clients Süd", "Old colleagues", "Conference 2024", "Band",
               "Running", "Cousins", "Landlords", "Plumbers & co", "Volunteers", "Board",
               "Alumni", "Ski trip", "Garden", "Emergency"]
CALENDAR_NAMES = ["Work", "Home", "Family", "Birthdays", "Football", "Travel", "Team Ünity",
                  "Doctor", "School", "Holidays", "Project Kestro", "Garden", "Choir",
                  "Finances", "Car", "Book club", "Gym", "Church", "Volunteering", "Misc"]
ZONES = ["Europe/Paris", "America/New_York", "Asia/Tokyo", "Australia/Sydney", "Europe/London"]
WEEKDAYS = ["sunday", "monday", "tuesday", "wednesday", "thursday", "friday", "saturday"]
WORDS = ("meeting review lunch call planning déjeuner Besprechung café sync retro demo "
         "interview budget dentist training workshop").split()


def jdate(when, tz):
    return {"$date": when.strftime("%Y-%m-%dT%H:%M:%S"), "tz": tz}


def line(out, identifier, record):
    out.write(json.dumps({"id": identifier, "record": record}, ensure_ascii=False))
    out.write("\n")


# --- contacts ---

def contact_record(rng, c, photo):
    """The contact record and its related records, as (id, record) pairs."""
    cid = f"contact-{c:06d}"
    related = []
    record = {"tessel.record.entity": "tessel.contacts.Contact",
              "first name": rng.choice(FIRST), "last name": rng.choice(LAST)}
    if rng.random() < 0.2:
        record["middle name"] = rng.choice(FIRST)
    company = rng.choice(COMPANIES)
    if company:
        record["company name"] = company
        job = rng.choice(JOBS)
        if job:
            record["job title"] = job
    if rng.random() < 0.1:
        record["notes"] = "Met at the conference; likes café au lait.\nCall after 18:00."
    if photo is not None:
        record["image"] = {"$data": photo}
    relationships = {}
    for n in range(rng.randint(1, 3)):
        rid = f"{cid}#phone{n + 1}"
        related.append((rid, {"tessel.record.entity": "tessel.contacts.PhoneNumber",
                              "value": f"+{rng.randint(1, 99)} {rng.randint(100, 999)} "
                                       f"{rng.randint(100000, 9999999)}",
                              "type": rng.choice(PHONE_TYPES)}))
        relationships.setdefault("phone numbers", []).append(rid)
    for n in range(rng.randint(1, 2)):
        rid = f"{cid}#email{n + 1}"
        related.append((rid, {"tessel.record.entity": "tessel.contacts.EmailAddress",
                              "value": f"person{c}.{n}@example{rng.randint(1, 50)}.org",
                              "type": rng.choice(KINDS)}))
        relationships.setdefault("email addresses", []).append(rid)
    if rng.random() < 0.7:
        rid = f"{cid}#address1"
        city, state, country = rng.choice(CITIES)
        address = {"tessel.record.entity": "tessel.contacts.StreetAddress",
                   "type": rng.choice(KINDS),
                   "street": f"{rng.randint(1, 200)} {rng.choice(STREETS)}",
                   "city": city, "postal code": str(rng.randint(10000, 99999)),
                   "country": country}
        if state:
            address["state"] = state
        related.append((rid, address))
        relationships["street addresses"] = [rid]
    if rng.random() < 0.1:
        rid = f"{cid}#url1"
        related.append((rid, {"tessel.record.entity": "tessel.contacts.URL",
                              "value": {"$url": f"https://example.org/~person{c}"},
                              "type": "home page"}))
        relationships["urls"] = [rid]
    if rng.random() < 0.05:
        rid = f"{cid}#im1"
        related.append((rid, {"tessel.record.entity": "tessel.contacts.IM",
                              "user": f"person{c}@jabber.example.org", "service": "Jabber",
                              "type": "home"}))
        relationships["instant messaging"] = [rid]
    return cid, record, relationships, related


def write_contacts(rng, size, photos_dir, out_dir):
    sizes = SIZES[size]
    photo_files = sorted(os.listdir(photos_dir))[:sizes["photos"]]
    if len(photo_files) < sizes["photos"]:
        raise SystemExit(f"{photos_dir} holds {len(photo_files)} pictures, "
                         f"{sizes['photos']} needed")
    every = sizes["contacts"] // sizes["photos"]
    # Group membership first: each contact is in zero to two groups, the first groups larger.
    members = [[] for _ in range(GROUPS)]
    parents = {}
    for c in range(sizes["contacts"]):
        for _ in range(rng.choice([0, 0, 1, 1, 1, 2])):
            g = min(int(rng.paretovariate(1.2)) - 1, GROUPS - 1)
            cid = f"contact-{c:06d}"
            if cid not in members[g]:
                members[g].append(cid)
                parents.setdefault(cid, []).append(f"group-{g:02d}")
    changed = None
    with open(os.path.join(out_dir, "contacts.jsonl"), "w", encoding="utf-8") as out:
        for c in range(sizes["contacts"]):
            photo = None
            if c % every == 0 and c // every < len(photo_files):
                with open(os.path.join(photos_dir, photo_files[c // every]), "rb") as f:
                    photo = base64.b64encode(f.read()).decode("ascii")
            cid, record, relationships, related = contact_record(rng, c, photo)
            if cid in parents:
                record["parent groups"] = parents[cid]
            record.update(relationships)
            line(out, cid, record)
            for rid, sub in related:
                line(out, rid, sub)
            # The contact that changes: one without a photo, in the middle of the book.
            if c == sizes["contacts"] // 2 + 1:
                changed = (cid, dict(record, **{"job title": "Changed for the bench"}))
        for g in range(GROUPS):
            line(out, f"group-{g:02d}", {"tessel.record.entity": "tessel.contacts.Group",
                                         "name": GROUP_NAMES[g], "members": members[g]})
    with open(os.path.join(out_dir, "change.jsonl"), "w", encoding="utf-8") as out:
        line(out, *changed)


# --- events ---

def zipf_sizes(total, count):
    weights = [1 / (k + 1) for k in range(count)]
    scale = total / sum(weights)
    sizes = [max(1, int(w * scale)) for w in weights]
    sizes[0] += total - sum(sizes)
    return sizes


class EventMaker:
    """The events of the store, one at a time, as lists of (id, record)."""

    def __init__(self, rng):
        self.rng = rng

    def when(self):
        rng = self.rng
        kind = rng.choices(["named", "utc", "floating", "allday"], [45, 20, 15, 20])[0]
        day = datetime.datetime(2020, 1, 1) + datetime.timedelta(days=rng.randint(0, 6 * 365))
        if kind == "allday":
            start = day.replace(hour=12)
            return kind, "GMT", start, start + datetime.timedelta(days=rng.choice([1, 1, 1, 2, 3]))
        start = day.replace(hour=rng.randint(7, 19), minute=rng.choice([0, 15, 30, 45]))
        end = start + datetime.timedelta(minutes=rng.choice([30, 45, 60, 90, 120, 180]))
        tz = {"named": rng.choice(ZONES), "utc": "UTC", "floating": "local"}[kind]
        return kind, tz, start, end

    def event(self, eid, calendar):
        rng = self.rng
        kind, tz, start, end = self.when()
        summary = " ".join(rng.choice(WORDS) for _ in range(rng.randint(1, 4))).capitalize()
        record = {"tessel.record.entity": "tessel.calendars.Event", "summary": summary,
                  "start date": jdate(start, tz), "end date": jdate(end, tz),
                  "all day": kind == "allday"}
        if rng.random() < 0.6:
            record["location"] = f"Room {rng.randint(1, 400)}, Building {rng.choice('ABCDÉ')}"
        if rng.random() < 0.4:
            record["description"] = (
                "Agenda: " + ", ".join(rng.choice(WORDS) for _ in range(rng.randint(3, 30))) +
                ";\nbring notes. Dial-in: +33 1 23 45 67 89, code 1234#")
        record["status"] = rng.choice(["confirmed", "confirmed", "tentative", "cancelled"])
        if rng.random() < 0.1:
            record["classification"] = "private"
        if rng.random() < 0.1:
            record["priority"] = rng.randint(1, 9)
        if rng.random() < 0.05:
            record["url"] = {"$url": f"https://meet.example.org/{eid}"}
        records = []
        detached = []
        if rng.random() < 0.2:
            freq = rng.choice(["daily", "weekly", "weekly", "monthly", "yearly"])
            step = {"daily": 1, "weekly": 7, "monthly": 30, "yearly": 365}[freq]
            rule = {"tessel.record.entity": "tessel.calendars.Recurrence", "frequency": freq,
                    "interval": rng.choice([1, 1, 2])}
            if rng.random() < 0.5:
                rule["count"] = rng.randint(3, 50)
            else:
                rule["until"] = jdate(start + datetime.timedelta(days=step * 40), "UTC")
            if freq == "weekly":
                rule["bydayfreq"] = [0]
                rule["bydaydays"] = [WEEKDAYS[(start.weekday() + 1) % 7]]
            if freq == "monthly":
                rule["bymonthday"] = [start.day]
            records.append((f"{eid}#recurrence1", rule))
            record["recurrences"] = [f"{eid}#recurrence1"]
            period = datetime.timedelta(days=step * rule["interval"])
            if rng.random() < 0.4:
                record["exception dates"] = [jdate(start + period * k, tz)
                                             for k in rng.sample(range(1, 3), rng.randint(1, 2))]
            if rng.random() < 0.15:
                did = f"{eid}#detached1"
                original = start + period * 3
                moved = original + datetime.timedelta(hours=1 if kind != "allday" else 24)
                records.append((did, {"tessel.record.entity": "tessel.calendars.Event",
                                      "summary": summary + " (moved)",
                                      "start date": jdate(moved, tz),
                                      "end date": jdate(moved + (end - start), tz),
                                      "original date": jdate(original, tz),
                                      "all day": kind == "allday", "calendar": [calendar]}))
                record["detached events"] = [did]
                detached.append(did)
        if rng.random() < 0.35:
            aid = f"{eid}#alarm1"
            alarm = rng.choices(["display", "audio", "mail"], [80, 15, 5])[0]
            sub = {"tessel.record.entity": f"tessel.calendars.{alarm.capitalize()}Alarm",
                   "trigger duration": -rng.choice([300, 900, 3600, 86400])}
            if alarm != "audio":
                sub["description"] = "Reminder: " + summary
            if alarm == "mail":
                sub["summary"] = summary
                sub["recipients"] = ["mailto:me@example.org"]
            records.append((aid, sub))
            record[f"{alarm} alarms"] = [aid]
        if rng.random() < 0.15:
            oid = f"{eid}#organizer"
            records.append((oid, {"tessel.record.entity": "tessel.calendars.Organizer",
                                  "common name": f"{rng.choice(FIRST)} {rng.choice(LAST)}",
                                  "email": f"mailto:organizer{rng.randint(1, 500)}@example.org"}))
            record["organizer"] = [oid]
            attendees = []
            for a in range(rng.randint(1, 6)):
                tid = f"{eid}#attendee{a + 1}"
                records.append((tid, {
                    "tessel.record.entity": "tessel.calendars.Attendee",
                    "common name": f"{rng.choice(FIRST)} {rng.choice(LAST)}",
                    "email": f"mailto:guest{rng.randint(1, 5000)}@example.org",
                    "role": rng.choice(["req-participant", "opt-participant", "chair"]),
                    "status": rng.choice(["needsaction", "accepted", "declined", "tentative"]),
                    "rsvp": rng.random() < 0.5}))
                attendees.append(tid)
            record["attendees"] = attendees
        record["calendar"] = [calendar]
        return [(eid, record)] + records, detached


def write_calendars(rng, size, out_dir):
    sizes = zipf_sizes(SIZES[size]["events"], CALENDARS)
    maker = EventMaker(rng)
    with open(os.path.join(out_dir, "calendars.jsonl"), "w", encoding="utf-8") as out:
        for c, count in enumerate(sizes):
            cal = f"calendar-{c:02d}"
            members = []
            for e in range(count):
                eid = f"{cal}-event-{e:06d}"
                records, detached = maker.event(eid, cal)
                for rid, record in records:
                    line(out, rid, record)
                members.append(eid)
                members.extend(detached)
            line(out, cal, {"tessel.record.entity": "tessel.calendars.Calendar",
                            "title": CALENDAR_NAMES[c], "events": members})
        order = [f"calendar-{c:02d}" for c in range(CALENDARS)]
        rng.shuffle(order)
        line(out, "calendar-order", {"tessel.record.entity": "tessel.calendars.CalendarOrder",
                                     "calendars": order})


# --- one .ics file ---

VTIMEZONES = {
    "Europe/Paris": ("+0100", "+0200", "CET", "CEST", "-1SU", "-1SU"),
    "America/New_York": ("-0500", "-0400", "EST", "EDT", "2SU", "1SU"),
}


def fold(text):
    data = text.encode("utf-8")
    if len(data) <= 75:
        return text + "\r\n"
    pieces, start, limit = [], 0, 75
    while start < len(data):
        end = min(start + limit, len(data))
        while end < len(data) and (data[end] & 0xC0) == 0x80:
            end -= 1
        pieces.append(data[start:end].decode("utf-8"))
        start, limit = end, 74
    return "\r\n ".join(pieces) + "\r\n"


def escape(text):
    return (text.replace("\\", "\\\\").replace(";", "\\;").replace(",", "\\,")
            .replace("\n", "\\n"))


def ics_time(kind, tz, when):
    if kind == "allday":
        return ";VALUE=DATE", when.strftime("%Y%m%d")
    if kind == "utc":
        return "", when.strftime("%Y%m%dT%H%M%SZ")
    if kind == "floating":
        return "", when.strftime("%Y%m%dT%H%M%S")
    return f";TZID={tz}", when.strftime("%Y%m%dT%H%M%S")


def write_ics(rng, events, path):
    out = ["BEGIN:VCALENDAR\r\n", "VERSION:2.0\r\n", "PRODID:-//zetosynctool//scale bench//EN\r\n",
           "CALSCALE:GREGORIAN\r\n", "X-WR-CALNAME:Scale\r\n"]
    for name, (std, dst, stdname, dstname, dstday, stdday) in VTIMEZONES.items():
        dst_month, std_month = ("3", "10") if name.startswith("Europe") else ("3", "11")
        out += [f"BEGIN:VTIMEZONE\r\nTZID:{name}\r\n",
                f"BEGIN:DAYLIGHT\r\nTZOFFSETFROM:{std}\r\nTZOFFSETTO:{dst}\r\nTZNAME:{dstname}\r\n"
                f"DTSTART:19700308T020000\r\nRRULE:FREQ=YEARLY;BYMONTH={dst_month};"
                f"BYDAY={dstday}\r\nEND:DAYLIGHT\r\n",
                f"BEGIN:STANDARD\r\nTZOFFSETFROM:{dst}\r\nTZOFFSETTO:{std}\r\nTZNAME:{stdname}\r\n"
                f"DTSTART:19701101T020000\r\nRRULE:FREQ=YEARLY;BYMONTH={std_month};"
                f"BYDAY={stdday}\r\nEND:STANDARD\r\n", "END:VTIMEZONE\r\n"]
    maker = EventMaker(rng)
    stamp = "DTSTAMP:20240101T000000Z\r\n"
    for e in range(events):
        kind, tz, start, end = maker.when()
        if tz not in VTIMEZONES and kind == "named":
            tz = "Europe/Paris"
        uid = f"scale-{e:06d}@example.org"
        summary = " ".join(rng.choice(WORDS) for _ in range(rng.randint(1, 4))).capitalize()
        p, v = ics_time(kind, tz, start)
        pe, ve = ics_time(kind, tz, end)
        body = [stamp, f"UID:{uid}\r\n", f"DTSTART{p}:{v}\r\n", f"DTEND{pe}:{ve}\r\n",
                fold("SUMMARY:" + escape(summary))]
        if rng.random() < 0.6:
            body.append(fold("LOCATION:" + escape(f"Room {rng.randint(1, 400)}, Bâtiment A")))
        if rng.random() < 0.4:
            body.append(fold("DESCRIPTION:" + escape(
                "Agenda: " + ", ".join(rng.choice(WORDS) for _ in range(rng.randint(3, 30))) +
                ";\nbring notes.")))
        body.append("STATUS:" + rng.choice(["CONFIRMED", "TENTATIVE", "CANCELLED"]) + "\r\n")
        detached = None
        if rng.random() < 0.2:
            body.append("RRULE:" + rng.choice(["FREQ=WEEKLY;COUNT=20;BYDAY=MO,WE",
                                               "FREQ=DAILY;INTERVAL=2;COUNT=10",
                                               "FREQ=MONTHLY;UNTIL=20300101T000000Z",
                                               "FREQ=YEARLY"]) + "\r\n")
            week = datetime.timedelta(days=7)
            if rng.random() < 0.4:
                xp, xv = ics_time(kind, tz, start + week)
                body.append(f"EXDATE{xp}:{xv}\r\n")
            if rng.random() < 0.15:
                rp, rv = ics_time(kind, tz, start + 2 * week)
                mp, mv = ics_time(kind, tz, start + 2 * week + datetime.timedelta(hours=1))
                detached = [stamp, f"UID:{uid}\r\n", f"RECURRENCE-ID{rp}:{rv}\r\n",
                            f"DTSTART{mp}:{mv}\r\n", fold("SUMMARY:" + escape(summary + " (moved)"))]
        if rng.random() < 0.15:
            body.append(fold(f"ORGANIZER;CN={rng.choice(LAST)}:mailto:org{rng.randint(1, 500)}"
                             "@example.org"))
            for _ in range(rng.randint(1, 6)):
                body.append(fold(f"ATTENDEE;CN={rng.choice(LAST)};ROLE=REQ-PARTICIPANT;"
                                 f"PARTSTAT=ACCEPTED;RSVP=TRUE:mailto:guest{rng.randint(1, 5000)}"
                                 "@example.org"))
        if rng.random() < 0.35:
            body.append("BEGIN:VALARM\r\nACTION:DISPLAY\r\nDESCRIPTION:Reminder\r\n"
                        "TRIGGER:-PT15M\r\nEND:VALARM\r\n")
        out.append("BEGIN:VEVENT\r\n")
        out += body
        out.append("END:VEVENT\r\n")
        if detached:
            out.append("BEGIN:VEVENT\r\n")
            out += detached
            out.append("END:VEVENT\r\n")
    out.append("END:VCALENDAR\r\n")
    with open(path, "w", encoding="utf-8", newline="") as f:
        f.write("".join(out))


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("what", choices=["records", "ics"])
    parser.add_argument("--size", choices=sorted(SIZES), default="S")
    parser.add_argument("--photos")
    parser.add_argument("--out", required=True)
    parser.add_argument("--events", type=int, default=20_000)
    parser.add_argument("--seed", type=int, default=2026)
    args = parser.parse_args()
    if args.what == "records":
        os.makedirs(args.out, exist_ok=True)
        write_contacts(random.Random(args.seed), args.size, args.photos, args.out)
        write_calendars(random.Random(args.seed + 1), args.size, args.out)
    else:
        write_ics(random.Random(args.seed), args.events, args.out)


if __name__ == "__main__":
    main()
