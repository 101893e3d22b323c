#!/usr/bin/env bash
# First full index of a corpus built from this machine's own files
# (/usr/include, /usr/share/doc and /usr/share/perl, copied; a folder that is
# missing is left out and the count printed says what was used). Prints the
# files indexed per second from "folder add" until the folder is reported
# finished, the peak memory of all the stack's processes together (the sum
# of their resident memory sampled every 0.2 s, extraction workers included,
# as RSS and as PSS)
# and each one's own peak, and what the index holds: documents and words,
# each with a hash, so a run before and after a change can be compared.
#
#   bench/system/corpus_index.sh [BUILD] [SCRATCH]
#
# With SCRATCH given, the corpus is kept there and reused by the next run
# (its index is removed first), and the dump of documents and words is left
# in SCRATCH/index-dump.txt.
set -euo pipefail
BUILD="$(realpath "${1:-build}")"
SCRATCH="${2:-$(mktemp -d /var/tmp/fileindex-bench-XXXXXX)}"
[ -z "${2:-}" ] || KEEP_SCRATCH=1
mkdir -p "$SCRATCH"
SCRATCH="$(realpath "$SCRATCH")"
source "$(dirname "$0")/common.sh"

corpus="$SCRATCH/corpus"
if [ ! -d "$corpus" ]; then
  mkdir -p "$corpus.part"
  for dir in /usr/include /usr/share/doc /usr/share/perl; do
    if [ -d "$dir" ]; then cp -r "$dir" "$corpus.part/$(basename "$dir")"; else echo "missing on this machine: $dir"; fi
  done
  mv "$corpus.part" "$corpus"
fi
rm -rf "$corpus/@eaDir"
rm -rf "$CORVLUMEX_ROOT"
files=$(find "$corpus" -type f | wc -l)
echo "corpus: $files files in $(find "$corpus" -type d | wc -l) folders, $(du -sh "$corpus" | cut -f1)"

bench_start corpus
daemons=()
for program in "${SYSTEM_PROGRAMS[@]}"; do daemons+=("$(cat "$(system_pid_file "$program")")"); done
indexer="$(cat "$(system_pid_file fileindexd)")"

# Resident memory of the daemons and of the indexer's extraction workers
# (its children), summed at each sample; the largest sum is the peak. Two
# sums: RSS counts a library page mapped by several processes once in each,
# PSS divides it among them, so the PSS sum is what the machine really gives
# the stack.
sample_memory() {
  local peak=0 peak_pss=0 total total_pss pid kib parts
  while :; do
    total=0 total_pss=0 parts=""
    for pid in "${daemons[@]}" $(pgrep -P "$indexer" || true); do
      # A worker may end between the listing and the reading.
      kib=$(awk '/^VmRSS/ {print $2}' "/proc/$pid/status" 2>/dev/null || true)
      total=$((total + ${kib:-0}))
      kib=$(awk '/^Pss:/ {print $2}' "/proc/$pid/smaps_rollup" 2>/dev/null || true)
      total_pss=$((total_pss + ${kib:-0}))
      parts="$parts $(cat "/proc/$pid/comm" 2>/dev/null || echo gone) $(( ${kib:-0} / 1024 ))"
    done
    if [ "$total" -gt "$peak" ]; then peak=$total; echo "$peak" > "$SCRATCH/memory_peak"; fi
    if [ "$total_pss" -gt "$peak_pss" ]; then
      peak_pss=$total_pss
      echo "$peak_pss" > "$SCRATCH/memory_peak_pss"
      echo "$parts" > "$SCRATCH/memory_peak_pss_parts"
    fi
    for pid in $(pgrep -P "$indexer" || true); do
      kib=$(awk '/VmHWM/ {print $2}' "/proc/$pid/status" 2>/dev/null || true)
      [ "${kib:-0}" -gt "$(cat "$SCRATCH/worker_peak" 2>/dev/null || echo 0)" ] && echo "$kib" > "$SCRATCH/worker_peak"
    done
    sleep 0.2
  done
}
# Busy and idle clock ticks of the whole machine (all cores), from /proc/stat.
machine_ticks() { awk '/^cpu / { print $2 + $3 + $4 + $7 + $8 + $9, $5 + $6 }' /proc/stat; }
# CPU seconds of the stack so far: the daemons, the live extraction workers
# and the workers the indexer reaped.
stack_cpu() {
  local pid
  for pid in "${daemons[@]}" $(pgrep -P "$indexer" || true); do
    cat "/proc/$pid/stat" 2>/dev/null || true
  done | awk '{ sub(/^.*\) /, ""); t += $12 + $13 } END { printf "%.2f", t / 100 }'
  awk '{ sub(/^.*\) /, ""); printf " %.2f\n", ($14 + $15) / 100 }' "/proc/$indexer/stat"
}

rm -f "$SCRATCH/memory_peak" "$SCRATCH/memory_peak_pss" "$SCRATCH/memory_peak_pss_parts" "$SCRATCH/worker_peak"
sample_memory & sampler=$!
trap 'kill "$sampler" 2>/dev/null || true; bench_finish' EXIT
read -r busy_before idle_before < <(machine_ticks)
read -r cpu_before reaped_before < <(stack_cpu)
start=$(date +%s.%N)
"$(system_program fileindex)" folder add /corpus --wait > /dev/null
end=$(date +%s.%N)
read -r cpu_after reaped_after < <(stack_cpu)
read -r busy_after idle_after < <(machine_ticks)
kill "$sampler" 2>/dev/null || true
wait "$sampler" 2>/dev/null || true

awk -v files="$files" -v start="$start" -v end="$end" \
  'BEGIN { s = end - start; printf "indexed %d files in %.1f s: %.0f files/s\n", files, s, files / s }'
printf 'peak memory of all processes together (sampled RSS): %d MiB; (sampled PSS, shared pages counted once): %d MiB\n' \
  $(( $(cat "$SCRATCH/memory_peak") / 1024 )) $(( $(cat "$SCRATCH/memory_peak_pss") / 1024 ))
echo "PSS at that peak, MiB per process:$(cat "$SCRATCH/memory_peak_pss_parts")"
# How busy the cores were: the stack's own CPU during the run against what
# the machine's cores could give in that time, and the whole machine's
# busy share (other work included).
awk -v cpu="$cpu_after $reaped_after $cpu_before $reaped_before" -v start="$start" -v end="$end" \
  -v cores="$(nproc)" -v busy="$((busy_after - busy_before))" -v idle="$((idle_after - idle_before))" \
  'BEGIN { split(cpu, c, " "); used = (c[1] + c[2]) - (c[3] + c[4]); wall = end - start
           printf "stack CPU during the run %.1f s over %.1f s on %d cores: the stack kept %.0f %% of the cores busy; the machine was %.0f %% busy (load average now %s)\n",
             used, wall, cores, 100 * used / (wall * cores), 100 * busy / (busy + idle), "'"$(cut -d' ' -f1-3 /proc/loadavg)"'" }'
printf 'own peaks (VmHWM): corvelasticd %d MiB, corvnotifyd %d MiB, fileindexd %d MiB, corvspotlightd %d MiB, extraction worker %d MiB\n' \
  $(( $(peak_kib corvelasticd) / 1024 )) $(( $(peak_kib corvnotifyd) / 1024 )) $(( $(peak_kib fileindexd) / 1024 )) \
  $(( $(peak_kib corvspotlightd) / 1024 )) $(( $(cat "$SCRATCH/worker_peak" 2>/dev/null || echo 0) / 1024 ))
for program in corvelasticd fileindexd; do
  pid="$(cat "$(system_pid_file "$program")")"
  awk -v name="$program" '{ printf "CPU %s: %.1f s\n", name, ($14 + $15) / 100 }' "/proc/$pid/stat"
done
# The extraction workers' CPU, counted in the indexer's reaped children.
awk '{ printf "CPU extraction workers (reaped): %.1f s\n", ($16 + $17) / 100 }' "/proc/$indexer/stat"

# What the index holds, read from a copy of its database after a clean stop:
# the documents (their keys) and the words of the full-text table (each
# word with its document and occurrence counts).
system_stop > /dev/null
db="$(find "$corpus/@eaDir" -name corvelasticd.db | head -1)"
dump="$SCRATCH/index-dump.txt"
"$BUILD/bench/system/system_index_dump" "$db" > "$dump"
# The media type of plain text read without the worker comes from its name,
# not from libmagic: its words are counted apart.
printf 'index: %d documents (hash %s), %d words outside the media type (hash %s), %d media type words\n' \
  "$(grep -c '^doc ' "$dump")" "$(grep '^doc ' "$dump" | sha256sum | cut -c1-16)" \
  "$(grep '^word ' "$dump" | grep -vc '^word CORVMDMediaTypes ')" \
  "$(grep '^word ' "$dump" | grep -v '^word CORVMDMediaTypes ' | sha256sum | cut -c1-16)" \
  "$(grep -c '^word CORVMDMediaTypes ' "$dump")"
echo "index database: $(du -sh "$corpus/@eaDir" | cut -f1)"
