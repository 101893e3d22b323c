# Shell helpers shared by scripts/run and the end-to-end figures in
# bench/system/: build the programs, start and stop the daemons in a
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
  # Progress as the build goes: one line per target built, and compiler
  # diagnostics matched on their "file:line: error:" form, so that a source
  # file named error.cc is not taken for one. A failed build ends with the
  # errors again and the path of its full log.
  local log="$build/build-progress.log" status=0
  if cmake --build "$build" -j "$(nproc)" --target "${SYSTEM_TARGETS[@]}" 2>&1 | tee "$log" | system_build_progress; then
    status=0
  else
    status=${PIPESTATUS[0]}
  fi
  if [ "$status" -ne 0 ]; then
    echo "build failed (full log: $log):" >&2
    grep -E ': (fatal )?error: ' "$log" | tail -20 >&2 || true
    return 1
  fi
  for target in fileindexd fileindex corvelasticd corvnotifyd corvcontentextractd corvvxmnotify corvspotlightd fileindex-web; do
    [ -x "$(system_program "$target")" ] || { echo "build failed: $target is missing" >&2; return 1; }
  done
}

system_build_progress() {  # filters build output to one line per target built, and diagnostics; never fails
  awk '/: (fatal )?error: |: warning: / { print; fflush(); next }
       /^\[ *[0-9]+%\] Built target / { sub(/^.*Built target /, ""); if (!seen[$0]++) { print "  built " $0; fflush() } }'
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

system_shares() {  # the sandbox registry's shares, one "name<TAB>path" line each
  local registry="$CORVLUMEX_ROOT/etc/corvlumex/shares.json"
  [ -f "$registry" ] || return 0
  grep -oE '\{"name": "[^"]*", "path": "[^"]*"\}' "$registry" |
    sed -E 's/^\{"name": "([^"]*)", "path": "([^"]*)"\}$/\1\t\2/'
}

system_add_share() {  # directory -> prints the share's name
  # Adds a share over the directory to the sandbox registry, keeping the
  # shares already there: their folders stay configured, and an indexed
  # folder whose share vanished from the registry would make every folder
  # command fail. A share's directory ends in its name, so a second folder
  # with the name of a registered share is refused.
  local dir="$1" name existing_name existing_path lines
  case "$dir" in *'"'*|*'\'*) echo "scripts/run: a folder path with \" or \\ cannot be a share: $dir" >&2; return 1 ;; esac
  name="$(basename "$dir")"
  lines="$(system_shares)"
  while IFS=$'\t' read -r existing_name existing_path; do
    [ "$existing_name" = "$name" ] || continue
    [ "$existing_path" = "$dir" ] && { echo "$name"; return 0; }
    echo "scripts/run: the share \"$name\" is already $existing_path; a share is named after its folder, so" \
      "$dir cannot be one too: rename that folder, or start afresh (scripts/run stop; rm -r ${CORVLUMEX_ROOT%/root})" >&2
    return 1
  done <<< "$lines"
  mkdir -p "$CORVLUMEX_ROOT/etc/corvlumex"
  {
    printf '['
    while IFS=$'\t' read -r existing_name existing_path; do
      [ -n "$existing_name" ] || continue
      printf '{"name": "%s", "path": "%s"},\n ' "$existing_name" "$existing_path"
    done <<< "$lines"
    printf '{"name": "%s", "path": "%s"}]\n' "$name" "$dir"
  } > "$CORVLUMEX_ROOT/etc/corvlumex/shares.json.new"
  mv "$CORVLUMEX_ROOT/etc/corvlumex/shares.json.new" "$CORVLUMEX_ROOT/etc/corvlumex/shares.json"
  echo "$name"
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
