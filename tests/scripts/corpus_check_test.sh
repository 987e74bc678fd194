#!/usr/bin/env bash
# scripts/corpus_check on three small exports of our own: its figures and categories must say
# what really landed. Exits 77 (skipped) without the two independent readers.
# Usage: corpus_check_test.sh BUILD_DIR
set -euo pipefail
root=$(cd "$(dirname "$0")/../.." && pwd)
build=$1
if ! /usr/bin/python3 -c 'import icalendar, vobject' 2>/dev/null; then
  echo "python3-icalendar or python3-vobject is missing (scripts/setup --corpus): skipped"
  exit 77
fi
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
mkdir "$work/exports"
cd "$work/exports"

# An address book with a calendar's extension: the kind comes from the content. The second
# card has no structured name, so it is found by its formatted name.
printf '%s\r\n' BEGIN:VCARD VERSION:3.0 'N:Doe;Jane;;;' 'FN:Jane Doe' 'ORG:Acme;Sales' \
  'TEL;TYPE=CELL:+1 555 0100' 'EMAIL;TYPE=WORK:jane@example.com' \
  'ADR;TYPE=HOME:PO Box 1;;1 Main St;Springfield;IL;62701;USA' 'CATEGORIES:Friends' END:VCARD \
  BEGIN:VCARD VERSION:3.0 'FN:Li Wei' 'TEL:+86 10 1234' END:VCARD >contacts.ics

# Everything here lands as it is: a zoned weekly event with an exception, an alarm and guests,
# and a whole-day event.
printf '%s\r\n' BEGIN:VCALENDAR VERSION:2.0 PRODID:test BEGIN:VEVENT UID:a SUMMARY:Standup \
  'DTSTART;TZID=Europe/Paris:20261102T093000' 'DTEND;TZID=Europe/Paris:20261102T094500' \
  'RRULE:FREQ=WEEKLY;COUNT=5;BYDAY=MO' 'EXDATE;TZID=Europe/Paris:20261109T093000' \
  'LOCATION:Room 4' 'ORGANIZER;CN=Ann:mailto:ann@example.com' \
  'ATTENDEE;CN=Bob;PARTSTAT=ACCEPTED:mailto:bob@example.com' \
  BEGIN:VALARM ACTION:DISPLAY DESCRIPTION:Standup TRIGGER:-PT15M END:VALARM END:VEVENT \
  BEGIN:VEVENT UID:b SUMMARY:Holiday 'DTSTART;VALUE=DATE:20261225' 'DTEND;VALUE=DATE:20261226' \
  END:VEVENT END:VCALENDAR >work.ics

# Our writer escapes a double quote, which readers keep as a backslash.
printf '%s\r\n' BEGIN:VCALENDAR VERSION:2.0 PRODID:test BEGIN:VEVENT UID:q \
  'SUMMARY:Book club: "Americanah"' DTSTART:20261112T190000Z DTEND:20261112T210000Z \
  END:VEVENT END:VCALENDAR >quotes.ics

# A value no reader can read: refused today, or imported with a warning.
printf '%s\r\n' BEGIN:VCALENDAR VERSION:2.0 PRODID:test BEGIN:VEVENT UID:t SUMMARY:Call \
  DTSTART:20261112T190000Z BEGIN:VALARM ACTION:DISPLAY TRIGGER:PT-2H END:VALARM END:VEVENT \
  END:VCALENDAR >broken.ics

echo 'not an export' >notes.txt

report=$("$root/scripts/corpus_check" "$work/exports" --build "$build")
echo "$report"
expect() {
  if ! grep -Eq -- "$1" <<<"$report"; then
    echo "FAILED: no line matches: $1"
    exit 1
  fi
}
# files, refused, unreadable (of them refused), cards in, landed, intact
expect '^\| 1 \| 0 \| 0 \(0\) \| 2 \| 2 \| 1 \|$'
# files, refused, unreadable (of them refused), events in, landed, tasks in, landed, intact;
# broken.ics lands whole when its importer skips the bad trigger.
expect '^\| 3 \| [01] \| 0 \(0\) \| 4 \| [34] \| 0 \| 0 \| [12] \|$'
expect 'field differs: summary: double quote written as \\": 1 files, 1 items: quotes\.ics$'
expect '^- (refused: TRIGGER|warning: ).*: 1 files.*broken.ics'
expect '^- not a calendar or address book: 1 files: notes.txt$'
