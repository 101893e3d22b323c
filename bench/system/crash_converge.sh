#!/usr/bin/env bash
# kill -9 of each daemon, KILLS times, during bulk work (folders of files
# created, folders renamed, folders deleted, a file appended to); each daemon
# is started again right after. After each kill the work stops and the
# script waits until the index (what a search lists) equals the disk (what
# find lists), printing how long that took. A kill after which the index
# does not come back within LIMIT seconds is reported with the difference,
# and the folder is then reindexed by hand so the next kill starts even.
#
#   bench/system/crash_converge.sh [BUILD] [KILLS] [DAEMONS] [LIMIT]
#   e.g. bench/system/crash_converge.sh build 20 "fileindexd corvelasticd corvnotifyd" 120
set -euo pipefail
BUILD="$(realpath "${1:-build}")"
KILLS="${2:-20}"
DAEMONS="${3:-fileindexd corvelasticd corvnotifyd}"
LIMIT="${4:-120}"
SCRATCH="$(mktemp -d /var/tmp/fileindex-bench-XXXXXX)"
source "$(dirname "$0")/common.sh"
probe="$BUILD/bench/system/system_index_probe"
share="$SCRATCH/crash"
work="$share/work"
stop_file="$SCRATCH/stop-work"
step_file="$SCRATCH/next-step"

bench_start crash
mkdir -p "$work"
for i in $(seq 300); do echo "seed file $i" > "$work/seed$i.txt"; done
"$(system_program fileindex)" folder add /crash --wait > /dev/null

work_step() {  # step number: creates a folder of files, renames the previous one, deletes an older one
  local step=$1 i
  mkdir -p "$work/new$step"
  for i in $(seq 200); do echo "file $i of step $step" > "$work/new$step/f$i.txt"; done
  [ ! -d "$work/new$((step - 1))" ] || mv "$work/new$((step - 1))" "$work/moved$step"
  [ ! -d "$work/moved$((step - 3))" ] || rm -rf "$work/moved$((step - 3))"
  echo "line $step" >> "$work/seed1.txt"
}

work_loop() {  # runs steps until the stop file appears; the next step's number goes to $step_file
  local step=$1
  while [ ! -e "$stop_file" ]; do work_step "$step"; step=$((step + 1)); echo "$step" > "$step_file"; done
}

disk_paths() { find "$share" -path "$share/@eaDir" -prune -o -print | sort; }
index_paths() { "$probe" paths crash 2>/dev/null | sort; }

now_ms() { date +%s%3N; }

echo 1 > "$step_file"
for daemon in $DAEMONS; do
  times=()
  failed=0
  for kill in $(seq "$KILLS"); do
    rm -f "$stop_file"
    work_loop "$(cat "$step_file")" &
    worker=$!
    sleep "$(awk -v r=$RANDOM 'BEGIN {printf "%.2f", 0.5 + 2.5 * r / 32768}')"
    kill -KILL "$(cat "$(system_pid_file "$daemon")")"
    sleep "$(awk -v r=$RANDOM 'BEGIN {printf "%.2f", r / 32768}')"
    system_start > /dev/null
    touch "$stop_file"
    wait "$worker"
    start=$(now_ms)
    deadline=$((start + LIMIT * 1000))
    until [ "$(disk_paths)" = "$(index_paths)" ]; do
      if [ "$(now_ms)" -gt "$deadline" ]; then
        diff <(disk_paths) <(index_paths) | grep '^[<>]' > "$SCRATCH/diff" || true
        echo "$daemon kill $kill: NOT converged after $LIMIT s: $(grep -c '^<' "$SCRATCH/diff") on disk only, $(grep -c '^>' "$SCRATCH/diff") in the index only (e.g. $(head -1 "$SCRATCH/diff"))"
        failed=$((failed + 1))
        # A daemon that hangs is reported above and started afresh here.
        system_running fileindexd || system_start > /dev/null
        "$(system_program fileindex)" folder reindex /crash --wait --timeout 120 > /dev/null ||
          echo "$daemon kill $kill: the reindex did not finish either (fileindexd stuck?)"
        break
      fi
      sleep 0.2
    done
    if [ "$(disk_paths)" = "$(index_paths)" ] && [ "$(now_ms)" -le "$deadline" ]; then
      ms=$(($(now_ms) - start))
      times+=("$ms")
      echo "$daemon kill $kill: converged in $ms ms ($(disk_paths | wc -l) entries)"
    fi
  done
  if [ ${#times[@]} -gt 0 ]; then
    printf '%s\n' "${times[@]}" | sort -n | awk -v d="$daemon" -v f="$failed" '
      {t[NR] = $1} END {printf "%s: %d kills converged (median %.1f s, max %.1f s), %d did not\n", d, NR, t[int((NR + 1) / 2)] / 1000, t[NR] / 1000, f}'
  else
    echo "$daemon: no kill converged, $failed did not"
  fi
done
