# Shared set-up of the end-to-end figures: a sandbox root with one share on
# a scratch folder, and the three daemons of the build folder. Source it
# after setting BUILD (the build folder) and SCRATCH (an empty folder).

src="$(cd "$(dirname "${BASH_SOURCE[0]}")/../.." && pwd)"
export FILEINDEX_SRC="$src" FILEINDEX_BUILD="$BUILD"
export CORVLUMEX_ROOT="$SCRATCH/root"
# shellcheck source=../../scripts/lib/system.sh
source "$src/scripts/lib/system.sh"

bench_start() {  # share name: registers $SCRATCH/<share> and starts the daemons
  mkdir -p "$SCRATCH/$1" "$CORVLUMEX_ROOT"
  system_write_share "$1" "$SCRATCH/$1"
  system_start
  trap bench_finish EXIT
}

bench_finish() {  # stops the daemons; removes the scratch folder unless it was given
  system_stop > /dev/null
  [ -n "${KEEP_SCRATCH:-}" ] || rm -rf "$SCRATCH"
}

peak_kib() {  # program name -> VmHWM of its running process, in KiB
  awk '/VmHWM/ {print $2}' "/proc/$(cat "$(system_pid_file "$1")")/status"
}
