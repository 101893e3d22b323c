#!/usr/bin/env bash
# Change-to-searchable latency: COUNT files written one after the other into
# an indexed folder; for each, the time from its close to the first search
# that finds its word. Prints the median and p99.
#
#   bench/system/latency.sh [BUILD] [COUNT]
set -euo pipefail
BUILD="$(realpath "${1:-build}")"
COUNT="${2:-200}"
SCRATCH="$(mktemp -d /var/tmp/fileindex-bench-XXXXXX)"
source "$(dirname "$0")/common.sh"

bench_start live
mkdir -p "$SCRATCH/live/inbox"
"$(system_program fileindex)" folder add /live --wait > /dev/null
"$BUILD/bench/system/system_latency_probe" "$SCRATCH/live/inbox" live "$COUNT" | tail -1
