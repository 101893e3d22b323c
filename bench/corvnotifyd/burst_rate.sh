#!/usr/bin/env bash
# How many new files a second corvnotifyd follows without losing events.
# Starts the real daemon in a throw-away sandbox on tmpfs, creates N empty
# files as fast as one process can (each file is two kernel events: create
# and close-after-write), stops the daemon and counts the lines it wrote.
# A run without a crash marker and with every create line is a sustained rate.
#
#   bench/corvnotifyd/burst_rate.sh [BUILD_DIR] [FILES]
set -euo pipefail
build="${1:-build}"
files="${2:-300000}"
here="$(cd "$(dirname "$0")" && pwd)"
daemon="$(cd "$build" && pwd)/programs/corvnotifyd/corvnotifyd"
maker="$(cd "$build" && pwd)/bench/corvnotifyd/make_files"
base="$(mktemp -d /dev/shm/corvnotifyd-bench-XXXXXX)"
trap 'rm -rf "$base"' EXIT
export CORVLUMEX_ROOT="$base/root"
share="$base/vol/share"
mkdir -p "$CORVLUMEX_ROOT/etc/corvlumex/monitor.d" "$share/docs/burst"
cat > "$CORVLUMEX_ROOT/etc/corvlumex/monitor.d/fileindex@bench.json" <<JSON
{"queue": "$share/@eaDir/fileindex.queue", "config": [{"path": "$share/docs", "mask": 65478, "ignore": ["@eaDir"]}]}
JSON
"$daemon" --foreground 2> "$base/log" &
pid=$!
for _ in $(seq 200); do grep -q "watching as configured" "$base/log" && break; sleep 0.05; done
"$maker" "$share/docs/burst" "$files"
kill -TERM "$pid"
wait "$pid"
queue="$share/@eaDir/fileindex.queue"
creates=$(grep -c '"event":64,' "$queue" || true)
# Every start writes one crash marker (changes made before it went unseen):
# only the markers after it are lost events.
crashes=$(( $(grep -c '"event":512,' "$queue" || true) - 1 ))
echo "kernel queue: $(cat /proc/sys/fs/inotify/max_queued_events) events"
echo "create lines: $creates of $files, crash markers: $crashes"
[ "$creates" -ge "$files" ] && [ "$crashes" -eq 0 ] && echo "no event lost" || { echo "events lost"; exit 1; }
