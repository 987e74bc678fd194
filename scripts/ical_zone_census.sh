#!/bin/sh
# Counts the distinct TZIDs of the development corpus's .ics files that the importer resolves
# to a zone of the time-zone database. The corpus is read from ../shared (next to the
# repository) and unpacked into a temporary folder, never into the repository.
# Usage: scripts/ical_zone_census.sh [build dir] [-v]
set -eu
root=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$root/build/default}
verbose=${2:-}
corpus=${ZT_CORPUS:-$root/../shared/realworld-corpus.tar.xz}
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
tar -xJf "$corpus" -C "$work"
find "$work" -name '*.ics' -print0 | xargs -0 "$build/bench/ical_zone_census" $verbose
