#!/usr/bin/env bash
# A single file written during a bulk copy: COUNT files are copied into an
# indexed folder; once the copy is under way, one new file with a word of its
# own is written into another folder of the share. Prints the time from that
# file's close until a search finds it, how much of the copy the index held
# then, and when the copy was indexed whole.
#
#   bench/system/bulk_latency.sh [BUILD] [COUNT] [RUNS]
set -euo pipefail
BUILD="$(realpath "${1:-build}")"
COUNT="${2:-5000}"
RUNS="${3:-3}"
SCRATCH="$(mktemp -d /var/tmp/fileindex-bench-XXXXXX)"
source "$(dirname "$0")/common.sh"
probe="$BUILD/bench/system/system_index_probe"

bench_start live
mkdir -p "$SCRATCH/live/inbox" "$SCRATCH/source"
for i in $(seq "$COUNT"); do echo "bulk file $i of the copy" > "$SCRATCH/source/f$i.txt"; done
"$(system_program fileindex)" folder add /live --wait > /dev/null

indexed_below() { "$probe" paths live | grep -c "^$SCRATCH/live/$1/" || true; }

for run in $(seq "$RUNS"); do
  cp -r "$SCRATCH/source" "$SCRATCH/live/copy$run" &
  copy=$!
  # Under way: a tenth of the files are there.
  while [ "$(find "$SCRATCH/live/copy$run" -type f 2>/dev/null | wc -l)" -lt $((COUNT / 10)) ]; do sleep 0.01; done
  word="fresh${run}x$RANDOM$RANDOM"
  echo "a new file with $word" > "$SCRATCH/live/inbox/new$run.txt"
  ms="$("$probe" wait live "$word" 600)"
  held="$(indexed_below "copy$run")"
  wait "$copy"
  start=$SECONDS
  while [ "$(indexed_below "copy$run")" -lt "$COUNT" ]; do sleep 0.5; done
  echo "run $run: new file searchable after $ms ms; the index held $held of the $COUNT copied files then; the whole copy $((SECONDS - start)) s after cp ended"
done
