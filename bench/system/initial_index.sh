#!/usr/bin/env bash
# Initial indexing of a corpus of real files copied from /usr/include and
# /usr/share/doc (twice /usr/include, once /usr/share/doc: over 20,000 files):
# files per second from "folder add" until the folder is indexed, and the
# peak memory (VmHWM) of each program, extraction workers included.
#
#   bench/system/initial_index.sh [BUILD] [SCRATCH]
set -euo pipefail
BUILD="$(realpath "${1:-build}")"
SCRATCH="${2:-$(mktemp -d /var/tmp/fileindex-bench-XXXXXX)}"
[ -z "${2:-}" ] || KEEP_SCRATCH=1
source "$(dirname "$0")/common.sh"

corpus="$SCRATCH/corpus"
mkdir -p "$corpus"
cp -r /usr/include "$corpus/include1"
cp -r /usr/include "$corpus/include2"
cp -r /usr/share/doc "$corpus/doc"
files=$(find "$corpus" | wc -l)
echo "corpus: $(find "$corpus" -type f | wc -l) files in $((files - $(find "$corpus" -type f | wc -l))) folders, $(du -sh "$corpus" | cut -f1)"

bench_start corpus
# The extraction workers come and go: sample their peak while indexing.
sample_workers() {
  while :; do
    for pid in $(pgrep -f 'corvcontentextractd --worker' || true); do
      kib=$(awk '/VmHWM/ {print $2}' "/proc/$pid/status" 2>/dev/null || echo 0)
      [ "${kib:-0}" -gt "$(cat "$SCRATCH/worker_peak" 2>/dev/null || echo 0)" ] && echo "$kib" > "$SCRATCH/worker_peak"
    done
    sleep 0.5
  done
}
sample_workers & sampler=$!
start=$(date +%s.%N)
"$(system_program fileindex)" folder add /corpus --wait > /dev/null
end=$(date +%s.%N)
kill "$sampler" 2>/dev/null || true
worker_peak=$(cat "$SCRATCH/worker_peak" 2>/dev/null || echo 0)
indexed=$("$(system_program fileindex)" --json status | awk -F: '/"total_done"/ {gsub(/[ ,]/, "", $2); print $2; exit}')

awk -v files="$files" -v start="$start" -v end="$end" \
  'BEGIN { s = end - start; printf "indexed %d entries in %.1f s: %.0f files/s\n", files, s, files / s }'
printf 'fileindexd operations done: %s\n' "$indexed"
printf 'peak memory (VmHWM): corvelasticd %d MiB, corvnotifyd %d MiB, fileindexd %d MiB, extraction worker %d MiB\n' \
  $(( $(peak_kib corvelasticd) / 1024 )) $(( $(peak_kib corvnotifyd) / 1024 )) $(( $(peak_kib fileindexd) / 1024 )) \
  $(( worker_peak / 1024 ))
echo "index database: $(du -sh "$SCRATCH/corpus/@eaDir/fileindex.db" | cut -f1)"
