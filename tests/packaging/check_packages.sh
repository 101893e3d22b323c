#!/usr/bin/env bash
# Builds the packages into WORK/packages and checks their contents with
# dpkg-deb: the library with its SONAME link, the development files, the
# programs, units, manual pages and completion, the maintainer scripts that
# create the service user and enable the units. lintian runs inside
# scripts/package, which fails on any error it reports.
#
#   tests/packaging/check_packages.sh WORK
set -euo pipefail
root="$(cd "$(dirname "$0")/../.." && pwd)"
work="${1:?usage: check_packages.sh WORK}"
rm -rf "$work"
mkdir -p "$work"
out="$work/packages"

"$root/scripts/package" "$out"

failures=0
fail() { echo "FAIL: $*" >&2; failures=$((failures + 1)); }

deb() {  # package name -> its .deb
  local found=("$out/$1"_*.deb)
  [ -e "${found[0]}" ] || { fail "no package $1 in $out"; echo /nonexistent; return; }
  echo "${found[0]}"
}

# package | path in the package, from data/expected_files.txt
while read -r package pattern; do
  [[ -n "$package" && $package != "#"* ]] || continue
  names="$(dpkg-deb -c "$(deb "$package")" | awk '{ $1 = $2 = $3 = $4 = $5 = ""; sub(/^ +/, ""); print }')"
  found=0
  while IFS= read -r name; do
    # shellcheck disable=SC2254
    case "$name" in $pattern) found=1; break ;; esac
  done <<< "$names"
  [ "$found" -eq 1 ] || fail "$package has no $pattern"
done < "$root/tests/packaging/data/expected_files.txt"

# The library's SONAME is the one its package is named after.
extract="$work/extract"
mkdir -p "$extract"
dpkg-deb -x "$(deb libfileindex1)" "$extract"
soname="$(objdump -p "$extract"/usr/lib/*/libfileindex.so.1 | awk '/SONAME/ {print $2}')"
[ "$soname" = "libfileindex.so.1" ] || fail "the library's SONAME is \"$soname\", not libfileindex.so.1"

# The units are installed with the programs' real paths and their hardening.
dpkg-deb -x "$(deb corvlumex)" "$extract"
for unit in "$extract"/lib/systemd/system/*.service; do
  grep -q '@[A-Z_]*@' "$unit" && fail "$(basename "$unit") still has an unconfigured @VARIABLE@"
  grep -q '^NoNewPrivileges=yes' "$unit" || fail "$(basename "$unit") lacks NoNewPrivileges=yes"
done
grep -q '^ExecStart=/usr/bin/corvelasticd' "$extract/lib/systemd/system/corvelasticd.service" ||
  fail "corvelasticd.service does not start /usr/bin/corvelasticd"
# fileindexd shares the lock files under /tmp with the command line.
grep -q '^PrivateTmp=yes' "$extract/lib/systemd/system/pkg-CorvLumex-fileindexd.service" &&
  fail "fileindexd's unit has a private /tmp, but its lock files are shared"

# Maintainer scripts: the service user, the units enabled, state purged.
control="$work/control"
dpkg-deb -e "$(deb corvlumex)" "$control"
# (the adduser call spans lines)
tr -d '\\\n' < "$control/postinst" | grep -q 'adduser --system.* CorvLumex' || fail "postinst does not create the service user CorvLumex"
grep -q 'deb-systemd-helper .*enable' "$control/postinst" || fail "postinst does not enable the units"
grep -q 'rm -rf /var/packages/CorvLumex' "$control/postrm" || fail "postrm does not purge the state folder"
grep -q 'deb-systemd-helper purge' "$control/postrm" || fail "postrm does not purge the units' enablement"
depends="$(dpkg-deb -f "$(deb corvlumex)" Depends)"
for need in libfileindex1 adduser; do
  [[ $depends == *"$need"* ]] || fail "corvlumex does not depend on $need (Depends: $depends)"
done

if [ "$failures" -ne 0 ]; then
  echo "$failures check(s) failed" >&2
  exit 1
fi
echo "packages checked: $(ls "$out")"
