# Shell helpers shared by scripts/run and the end-to-end figures in
# bench/system/: build the programs, start and stop the three daemons in a
# sandbox root, wait for their sockets. Source it; it sets no options.
#
# Inputs (set before calling):
#   FILEINDEX_SRC    the source tree
#   FILEINDEX_BUILD  the build folder (default $FILEINDEX_SRC/build)
#   CORVLUMEX_ROOT   the sandbox root; the daemons' logs and pid files go
#                    to $CORVLUMEX_ROOT/var/log/corvlumex and .../var/run

SYSTEM_PROGRAMS=(corvelasticd corvnotifyd fileindexd corvspotlightd)
SYSTEM_TARGETS=(corvelasticd corvnotifyd fileindexd fileindex_cli corvcontentextractd corvvxmnotify corvspotlightd fileindex-web)

system_build() {  # builds only what is needed, reusing an existing build folder
  local build="${FILEINDEX_BUILD:-$FILEINDEX_SRC/build}"
  mkdir -p "$build"
  # Configured every time: an older build folder learns about new programs.
  cmake -S "$FILEINDEX_SRC" -B "$build" -DCMAKE_BUILD_TYPE=RelWithDebInfo > "$build.configure.log" 2>&1 ||
    { cat "$build.configure.log"; return 1; }
  cmake --build "$build" -j "$(nproc)" --target "${SYSTEM_TARGETS[@]}" 2>&1 | grep -E 'error|warning:|Built target' || true
  for target in fileindexd fileindex corvelasticd corvnotifyd corvcontentextractd corvvxmnotify corvspotlightd fileindex-web; do
    [ -x "$(system_program "$target")" ] || { echo "build failed: $target is missing" >&2; return 1; }
  done
}

system_program() {  # path of a built program
  local build="${FILEINDEX_BUILD:-$FILEINDEX_SRC/build}"
  echo "$build/programs/$1/$1"
}

system_log_dir() { echo "$CORVLUMEX_ROOT/var/log/corvlumex"; }
system_pid_file() { echo "$CORVLUMEX_ROOT/var/run/$1.pid"; }

system_wait_socket() {  # socket path, seconds
  local deadline=$((SECONDS + $2))
  while [ ! -S "$1" ]; do
    [ $SECONDS -lt $deadline ] || { echo "timed out waiting for $1" >&2; return 1; }
    sleep 0.1
  done
}

system_running() {  # program name -> true when its recorded pid is alive
  local pid_file; pid_file="$(system_pid_file "$1")"
  [ -f "$pid_file" ] && kill -0 "$(cat "$pid_file")" 2>/dev/null
}

system_start() {  # starts the daemons in the sandbox root (those not running yet)
  local logs; logs="$(system_log_dir)"
  mkdir -p "$logs" "$CORVLUMEX_ROOT/var/run" "$CORVLUMEX_ROOT/etc/corvlumex/monitor.d" "$CORVLUMEX_ROOT/tmp" \
    "$CORVLUMEX_ROOT/var/packages/CorvLumex/etc"
  # The administrators' notice tool, where the library runs it.
  mkdir -p "$CORVLUMEX_ROOT/usr/corv/bin"
  ln -sf "$(system_program corvvxmnotify)" "$CORVLUMEX_ROOT/usr/corv/bin/corvvxmnotify"
  # The extraction worker is not a service: the library starts it on demand.
  export CORVLUMEX_EXTRACT_WORKER; CORVLUMEX_EXTRACT_WORKER="$(system_program corvcontentextractd)"
  local program args
  for program in "${SYSTEM_PROGRAMS[@]}"; do
    system_running "$program" && continue
    case "$program" in
      corvelasticd) args=(--log-stderr) ;;
      # Samba's Spotlight back end asks it over loopback HTTP; in a sandbox
      # any free port (the log names it), FILEINDEX_SPOTLIGHT_PORT to choose.
      corvspotlightd) args=(--log-stderr --port "${FILEINDEX_SPOTLIGHT_PORT:-0}") ;;
      *) args=(--foreground) ;;
    esac
    nohup "$(system_program "$program")" "${args[@]}" >> "$logs/$program.log" 2>&1 < /dev/null &
    echo $! > "$(system_pid_file "$program")"
    if [ "$program" = corvelasticd ]; then system_wait_socket "$CORVLUMEX_ROOT/var/run/corvelasticd.sock" 20; fi
    if [ "$program" = fileindexd ]; then system_wait_socket "$CORVLUMEX_ROOT/var/run/fileindexd.sock" 20; fi
  done
}

system_stop() {  # stops the daemons started by system_start (SIGTERM, then SIGKILL after 10 s)
  local program pid pid_file
  for program in fileindex-web corvspotlightd fileindexd corvnotifyd corvelasticd; do
    pid_file="$(system_pid_file "$program")"
    [ -f "$pid_file" ] || continue
    pid="$(cat "$pid_file")"
    if kill -0 "$pid" 2>/dev/null; then
      kill -TERM "$pid" 2>/dev/null || true
      for _ in $(seq 100); do kill -0 "$pid" 2>/dev/null || break; sleep 0.1; done
      kill -0 "$pid" 2>/dev/null && kill -KILL "$pid" 2>/dev/null || true
      echo "stopped $program ($pid)"
    fi
    rm -f "$pid_file"
  done
}

system_write_share() {  # name, directory: writes a one-share registry
  mkdir -p "$CORVLUMEX_ROOT/etc/corvlumex"
  printf '[{"name": "%s", "path": "%s"}]\n' "$1" "$2" > "$CORVLUMEX_ROOT/etc/corvlumex/shares.json"
}

system_web_link_file() { echo "$CORVLUMEX_ROOT/var/run/fileindex-web.sign-in"; }

system_web_start() {  # port: starts the web daemon (pages from the source tree) and waits for its sign-in link
  local logs link; logs="$(system_log_dir)"; link="$(system_web_link_file)"
  system_running fileindex-web && return 0
  rm -f "$link"
  nohup "$(system_program fileindex-web)" --port "$1" --web-root "$FILEINDEX_SRC/web" \
    --sign-in-link-file "$link" >> "$logs/fileindex-web.log" 2>&1 < /dev/null &
  echo $! > "$(system_pid_file fileindex-web)"
  local deadline=$((SECONDS + 20))
  while [ ! -s "$link" ]; do
    system_running fileindex-web || { tail -3 "$logs/fileindex-web.log" >&2; return 1; }
    [ $SECONDS -lt $deadline ] || { echo "timed out waiting for fileindex-web" >&2; return 1; }
    sleep 0.1
  done
}
