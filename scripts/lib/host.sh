# scripts/run --host FOLDER: the system on a real host, as root, without a
# sandbox root. The programs are installed (cmake --install, /usr/local by
# default) with their systemd units, FOLDER becomes a share in
# /etc/corvlumex/shares.json, and the units are started.

HOST_UNITS=(corvelasticd.service corvnotifyd.service corvcontentextractd.service pkg-CorvLumex-fileindexd.service
  corvspotlightd.service)

host_register_share() {  # name, directory
  local registry=/etc/corvlumex/shares.json
  mkdir -p /etc/corvlumex
  if [ ! -s "$registry" ]; then
    printf '[{"name": "%s", "path": "%s"}]\n' "$1" "$2" > "$registry"
    echo "share \"$1\" registered in $registry"
  elif grep -q "\"path\": *\"$2\"" "$registry"; then
    echo "share \"$1\" is already in $registry"
  else
    # Never rewrite an administrator's registry by guesswork.
    echo "scripts/run: add {\"name\": \"$1\", \"path\": \"$2\"} to the array in $registry, then run again" >&2
    return 1
  fi
}

host_run() {  # folder
  [ "$(id -u)" -eq 0 ] || { echo "scripts/run --host must run as root" >&2; return 1; }
  unset CORVLUMEX_ROOT
  local folder share build
  folder="$(realpath "$1")"
  [ -d "$folder" ] || { echo "scripts/run: $1 is not a folder" >&2; return 2; }
  share="$(basename "$folder")"
  build="${FILEINDEX_BUILD:-$FILEINDEX_SRC/build}"
  "$FILEINDEX_SRC/scripts/bootstrap"
  system_build
  echo "== installing the programs and their systemd units"
  cmake --install "$build" > /dev/null
  ldconfig  # the library went to /usr/local/lib
  # The library runs the administrators' notice tool from this fixed place.
  mkdir -p /usr/corv/bin
  [ -e /usr/corv/bin/corvvxmnotify ] || ln -s "$(command -v corvvxmnotify)" /usr/corv/bin/corvvxmnotify
  systemctl daemon-reload
  # The state files' folder and the notifier's configuration folder.
  mkdir -p /var/packages/CorvLumex/etc /etc/corvlumex/monitor.d
  host_register_share "$share" "$folder"
  systemctl enable --now "${HOST_UNITS[@]}"
  command -v fileindex > /dev/null || { echo "fileindex is not on PATH after the install" >&2; return 1; }
  if fileindex folder get "/$share" > /dev/null 2>&1; then
    fileindex folder reindex "/$share" --wait
  else
    fileindex folder add "/$share" --wait
  fi
  fileindex status
  cat <<DONE

The system runs under systemd; changes in $folder reach the index on their own.
  search:  fileindex search WORDS
  status:  fileindex status
  stop:    systemctl disable --now ${HOST_UNITS[*]}
DONE
}
