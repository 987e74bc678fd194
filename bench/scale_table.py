#!/usr/bin/env python3
"""The table of bench/scale, from its results file: python3 bench/scale_table.py RESULTS SIZES"""
import sys
values = {}
for line in open(sys.argv[1]):
    key, _, value = line.strip().partition(" ")
    values[key] = value
sizes = sys.argv[2].split()
MiB = 1024 * 1024
def f(key): return float(values[key])
rows = []
def row(name, measured, peer, ratio, goal, ok):
    rows.append((name, measured, peer, f"{ratio:.2f}" if ratio is not None else "",
                 goal + ("" if ok is None else (" ok" if ok else " **MISSED**"))))
for s in sizes:
    floors = [float(t) for t in values[f"{s}.floor_all"].split()]
    floor = min(floors)
    vcf, big = f(f"{s}.vcf_bytes"), f(f"{s}.ics_largest_bytes")
    first_kib, unch_kib = f(f"{s}.first_kib"), f(f"{s}.unchanged_kib")
    files = f"Tessel.vcf {vcf / MiB:.1f} MiB + .ics {f(s + '.ics_total_bytes') / MiB:.1f} MiB"
    row(f"{s} floor: cp + fsync of the synced files, best of {len(floors)}", f"{floor:.3f} s",
        f"{files}; worst {max(floors):.3f} s", None, "", None)
    photos = f(f"{s}.photos_s")
    bound = photos + 3 * floor
    row(f"{s} first sync", f"{f(s + '.first_s'):.2f} s",
        f"photos alone {photos:.2f} s + 3x floor = {bound:.2f} s", f(s + ".first_s") / bound,
        "<= 1", f(s + ".first_s") <= bound)
    limit = vcf + 2 * big + 64 * MiB
    row(f"{s} first sync peak memory", f"{first_kib / 1024:.1f} MiB",
        f"vcf + 2x largest .ics + 64 MiB = {limit / MiB:.1f} MiB", first_kib * 1024 / limit,
        "<= 1", first_kib * 1024 <= limit)
    row(f"{s} unchanged sync", f"{f(s + '.unchanged_s'):.2f} s", f"floor {floor:.3f} s",
        f(s + ".unchanged_s") / floor, "<= 3", f(s + ".unchanged_s") <= 3 * floor)
    limit = 2 * big + 64 * MiB
    row(f"{s} unchanged sync peak memory", f"{unch_kib / 1024:.1f} MiB",
        f"2x largest .ics + 64 MiB = {limit / MiB:.1f} MiB", unch_kib * 1024 / limit, "<= 1",
        unch_kib * 1024 <= limit)
    row(f"{s} push after one contact changed", f"{f(s + '.change_s'):.2f} s",
        f"floor {floor:.3f} s", f(s + ".change_s") / floor, "<= 10",
        f(s + ".change_s") <= 10 * floor)
    row(f"{s} push after one change, peak memory", f"{f(s + '.change_kib') / 1024:.1f} MiB", "",
        None, "", None)
    records = f(s + ".put_calendars_records")
    rate = records / f(s + ".put_calendars_s")
    row(f"{s} records put, {int(records)} small records", f"{rate:,.0f} records/s",
        "100,000 records/s", rate / 100000, ">= 1", rate >= 100000)
if len(sizes) == 2:
    g = f("L.first_s") / f("S.first_s")
    row("growth S to L, first sync", f"{f('L.first_s'):.2f} s", f"S {f('S.first_s'):.2f} s", g,
        "<= 10.5", g <= 10.5)
r = float(values.get("exporter_ratio") or "nan")
row("calendar exporter vs libical as_ical_string (50,000 events)",
    f"{values.get('exporter_s')} s", f"libical {values.get('libical_write_s')} s", r, ">= 2.5",
    r >= 2.5)
ratio = f("import_s") / f("libical_parse_s")
row("tessel import ical, 20,000 events", f"{f('import_s'):.2f} s",
    f"libical parse process {f('libical_parse_s'):.2f} s (parse alone {f('libical_parse_only_s'):.2f} s)",
    ratio, "<= 2", ratio <= 2)
limit = f("ics_bytes") + 64 * MiB
row("tessel import ical peak memory", f"{f('import_kib') / 1024:.1f} MiB",
    f"file {f('ics_bytes') / MiB:.1f} MiB + 64 MiB; libical {f('libical_parse_kib') / 1024:.1f} MiB",
    f("import_kib") * 1024 / limit, "<= 1", f("import_kib") * 1024 <= limit)
ours = f("ours_500_s")
for key, name in (("mogrify_s", "ImageMagick mogrify -thumbnail, one process, 500 photos"),
                  ("convert_each_s", "ImageMagick convert -thumbnail, one process per photo"),
                  ("vipsthumbnail_s", "vipsthumbnail -s 256x256, one process, 500 photos")):
    if key in values:
        row(name, f"{f(key):.2f} s", f"ours (photo code alone) {ours:.2f} s", f(key) / ours,
            "peer / ours", None)
print("| | measured | floor/peer | ratio | goal |")
print("|---|---|---|---|---|")
for r in rows:
    print("| " + " | ".join(r) + " |")
print()
for s in sizes:
    print(f"{s}: {values[s + '.cards']} cards ({values[s + '.photos_in_file']} with a photo), "
          f"{values[s + '.events_in_files']} VEVENTs in the .ics files; change landed: "
          f"{values[s + '.change_landed']}; load after the syncs: {values[s + '.load']}")
print(f"load at the end: {values['load_end']}")
