#!/usr/bin/env bash
# The Debian package: `cpack -G DEB` from the build into a temporary folder,
# then, in the .deb,
#  - the control fields (name vellis, the version, a Maintainer, a Depends
#    line made by dpkg-shlibdeps) and the <name>_<version>_<arch>.deb name;
#  - the four programs in usr/bin, libfileindex with its SONAME link, the
#    systemd units, the docs, and nothing outside usr/;
#  - the units' ExecStart naming programs of the package;
#  - the maintainer scripts of packaging/debian, executable, and the
#    ldconfig trigger.
#   tests/scripts/deb_package_test.sh CPACK_COMMAND BUILD_DIR PACKAGING_DIR
# Exits 77 (skipped) without dpkg-deb, dpkg-shlibdeps or file.
set -uo pipefail
cpack="$1"
build=$(cd "$2" && pwd)
packaging="$3"
fail() { echo "FAIL: $*" >&2; exit 1; }

for tool in dpkg-deb dpkg-shlibdeps file; do
  if ! command -v "$tool" > /dev/null; then
    echo "SKIP: $tool not found (scripts/setup.sh installs it)"
    exit 77
  fi
done

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
(cd "$build" && "$cpack" -G DEB -B "$work/out") > "$work/cpack.log" 2>&1 ||
  fail "cpack failed: $(cat "$work/cpack.log")"
debs=("$work"/out/*.deb)
[ ${#debs[@]} = 1 ] && [ -f "${debs[0]}" ] || fail "cpack made [${debs[*]}], expected one .deb"
deb="${debs[0]}"

field() { dpkg-deb -f "$deb" "$1"; }
[ "$(field Package)" = vellis ] || fail "Package is [$(field Package)]"
version=$(field Version)
arch=$(field Architecture)
[ -n "$version" ] && [ -n "$arch" ] || fail "no Version or Architecture"
[ "$(basename "$deb")" = "vellis_${version}_${arch}.deb" ] ||
  fail "file name $(basename "$deb") is not vellis_${version}_${arch}.deb"
[ -n "$(field Maintainer)" ] || fail "no Maintainer"
[ -n "$(field Description)" ] || fail "no Description"
depends=$(field Depends)
grep -Eq '(^|, )libc6 \(>= [0-9.]+\)' <<< "$depends" ||
  fail "Depends [$depends] was not made by dpkg-shlibdeps (no versioned libc6)"
grep -q 'vellis' <<< "$depends" && fail "the package depends on itself: $depends"

# The files.
dpkg-deb -c "$deb" | awk '{print $1, $6}' > "$work/list"
has() {  # has MODE_PREFIX PATH: the listing holds PATH with a mode starting so
  grep -q "^$1[^ ]* \./$2\$" "$work/list" || fail "the package has no $2 (mode $1...)"
}
for p in vellis vellis-notify vellis-searchd vellis-fileindexd vellis-monitord; do has -rwxr-xr-x "usr/bin/$p"; done
for u in vellis-searchd.service vellis-fileindexd.service vellis-monitord.service; do has -rw-r--r-- "usr/lib/systemd/system/$u"; done
has -rw-r--r-- usr/share/doc/vellis/README.md
has -rw-r--r-- usr/share/doc/vellis/docs/install.md
grep -Eq '^l[^ ]* \./usr/lib/([^/]+/)?libfileindex\.so\.0$' "$work/list" ||
  fail "the package has no libfileindex.so.0 link"
grep -Eq '^-[^ ]* \./usr/lib/([^/]+/)?libfileindex\.so\.0\.[0-9.]+$' "$work/list" ||
  fail "the package has no libfileindex.so.0.X.Y"
outside=$(awk '{print $2}' "$work/list" | grep -v '^\./usr/' | grep -vx '\./')
[ -z "$outside" ] || fail "files outside usr/: $outside"

# The units run programs of the package.
dpkg-deb -x "$deb" "$work/tree"
for u in vellis-searchd vellis-fileindexd vellis-monitord; do
  exe=$(sed -n 's/^ExecStart=\([^ ]*\).*/\1/p' "$work/tree/usr/lib/systemd/system/$u.service")
  [ "$exe" = "/usr/bin/$u" ] || fail "$u.service runs [$exe], expected /usr/bin/$u"
done

# The maintainer scripts and the trigger.
dpkg-deb -e "$deb" "$work/control"
for script in postinst prerm postrm; do
  [ -x "$work/control/$script" ] || fail "no executable $script in the package"
  cmp -s "$work/control/$script" "$packaging/debian/$script" ||
    fail "the package's $script differs from packaging/debian/$script"
done
grep -qx 'activate-noawait ldconfig' "$work/control/triggers" || fail "no ldconfig trigger"

echo "package $(basename "$deb"): Depends: $depends"
