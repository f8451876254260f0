#!/usr/bin/env bash
# The installed layout: `cmake --install BUILD_DIR --prefix /usr` into a
# temporary DESTDIR, then
#  - the four programs, executable, all in the one bin folder (the services
#    layer finds the daemons beside the running program), and nothing else
#    there; libfileindex with its SONAME link, and no other library;
#  - the systemd units, each ExecStart naming an installed program run with
#    --foreground, Documentation naming an installed page, the indexing
#    daemon ordered after the search daemon;
#  - the installed programs finding libfileindex in the install, never in
#    the build tree: no RUNPATH into the build tree, ldd resolves every
#    library (LD_LIBRARY_PATH on the installed lib folder), and an $ORIGIN
#    RUNPATH, where there is one, resolves on its own;
#  - the README and docs/ under share/doc/vellis;
#  - `systemd-analyze verify` accepts the units (skipped without it).
#   tests/scripts/install_layout_test.sh CMAKE_COMMAND BUILD_DIR
set -uo pipefail
cmake="$1"
build=$(cd "$2" && pwd)
fail() { echo "FAIL: $*" >&2; exit 1; }

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
dest="$work/root"
DESTDIR="$dest" "$cmake" --install "$build" --prefix /usr > "$work/install.log" 2>&1 ||
  fail "cmake --install failed: $(cat "$work/install.log")"

cache_value() {  # the value of a variable in the build's CMakeCache.txt
  sed -n "s/^$1:[A-Z]*=//p" "$build/CMakeCache.txt"
}
under_prefix() {  # /usr/<dir>, or <dir> as it is when absolute
  case "$1" in /*) echo "$1" ;; *) echo "/usr/$1" ;; esac
}
bindir=$(under_prefix "$(cache_value CMAKE_INSTALL_BINDIR)")
libdir=$(under_prefix "$(cache_value CMAKE_INSTALL_LIBDIR)")
docdir=$(under_prefix "$(cache_value CMAKE_INSTALL_DOCDIR)")
unitdir=$(under_prefix "$(cache_value VELLIS_SYSTEMD_UNIT_DIR)")
[ -n "$bindir" ] && [ -n "$libdir" ] && [ -n "$docdir" ] && [ -n "$unitdir" ] ||
  fail "install folders missing from $build/CMakeCache.txt"

programs="vellis vellis-notify vellis-searchd vellis-fileindexd vellis-monitord"
units="vellis-searchd.service vellis-fileindexd.service vellis-monitord.service"

# Programs: present, executable, and alone in the bin folder.
for p in $programs; do
  [ -f "$dest$bindir/$p" ] && [ -x "$dest$bindir/$p" ] || fail "$bindir/$p missing or not executable"
done
got=$(ls "$dest$bindir" | sort | tr '\n' ' ')
want=$(echo $programs | tr ' ' '\n' | sort | tr '\n' ' ')
[ "$got" = "$want" ] || fail "$bindir holds [$got], expected [$want]"

# The library: the real file, the SONAME link to it, nothing else.
lib_files=$(cd "$dest$libdir" && find . -maxdepth 1 ! -type d -printf '%f\n' | sort)
real=$(cd "$dest$libdir" && ls libfileindex.so.*.* 2>/dev/null)
[ -n "$real" ] && [ -f "$dest$libdir/$real" ] && [ ! -L "$dest$libdir/$real" ] ||
  fail "no libfileindex.so.X.Y.Z in $libdir (holds: $lib_files)"
soname=$(readelf -d "$dest$libdir/$real" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
[ -n "$soname" ] || fail "$real has no SONAME"
[ -L "$dest$libdir/$soname" ] && [ "$(readlink "$dest$libdir/$soname")" = "$real" ] ||
  fail "$libdir/$soname is not a link to $real"
[ "$(echo $lib_files)" = "$(echo "$soname $real" | tr ' ' '\n' | sort | tr '\n' ' ' | sed 's/ $//')" ] ||
  fail "$libdir holds [$(echo $lib_files)], expected only $soname and $real"

# Units: each ExecStart is an installed program of ours with --foreground.
for u in $units; do
  f="$dest$unitdir/$u"
  [ -f "$f" ] || fail "$unitdir/$u missing"
  exec_lines=$(grep -c '^ExecStart=' "$f")
  [ "$exec_lines" = 1 ] || fail "$u has $exec_lines ExecStart lines"
  read -r exe args <<< "$(sed -n 's/^ExecStart=//p' "$f")"
  case "$exe" in "$bindir"/*) ;; *) fail "$u: ExecStart $exe is not in $bindir" ;; esac
  [ -f "$dest$exe" ] && [ -x "$dest$exe" ] || fail "$u: ExecStart $exe is not an installed program"
  [ "$args" = "--foreground" ] || fail "$u: ExecStart arguments are [$args], expected --foreground"
  [ "${u%.service}" = "$(basename "$exe")" ] || fail "$u runs $exe"
  grep -qx 'Type=simple' "$f" || fail "$u is not Type=simple"
  grep -qx 'Restart=on-failure' "$f" || fail "$u has no Restart=on-failure"
  grep -qx 'WantedBy=multi-user.target' "$f" || fail "$u is not wanted by multi-user.target"
  doc=$(sed -n 's/^Documentation=file://p' "$f")
  [ -n "$doc" ] && [ -f "$dest$doc" ] || fail "$u: Documentation file:$doc is not installed"
  grep -Eq '@[A-Z_]+@' "$f" && fail "$u has an unreplaced @VARIABLE@: $(grep -E '@[A-Z_]+@' "$f")"
done
grep -Eq '^After=.*\bvellis-searchd\.service\b' "$dest$unitdir/vellis-fileindexd.service" &&
  grep -Eq '^Wants=.*\bvellis-searchd\.service\b' "$dest$unitdir/vellis-fileindexd.service" ||
  fail "vellis-fileindexd.service is not ordered after (and does not want) vellis-searchd.service"
grep -q 'vellis-fileindexd' "$dest$unitdir/vellis-searchd.service" &&
  fail "vellis-searchd.service depends on the indexing daemon"

# Libraries: no RUNPATH into the build tree; ldd finds everything, and finds
# libfileindex in the install.
resolved() {  # the real file that ldd's output (stdin) gives for library $1
  local path
  path=$(sed -n "s/^[[:space:]]*$1 => \(.*\) (0x[0-9a-f]*)\$/\1/p")
  [ -n "$path" ] && realpath "$path"
}
installed_lib=$(realpath "$dest$libdir/$soname")
for f in $(for p in $programs; do echo "$dest$bindir/$p"; done) "$dest$libdir/$real"; do
  runpath=$(readelf -d "$f" | sed -n 's/.*(\(RUNPATH\|RPATH\)).*\[\(.*\)\]/\2/p')
  IFS=: read -ra entries <<< "$runpath"
  for e in "${entries[@]}"; do
    case "$e" in '$ORIGIN'*) ;; *) fail "${f#$dest} has RUNPATH entry $e (only \$ORIGIN-relative ones may be installed)" ;; esac
  done
  out=$(LD_LIBRARY_PATH="$dest$libdir" ldd "$f" 2>&1) || fail "ldd ${f#$dest}: $out"
  grep -q 'not found' <<< "$out" && fail "${f#$dest} misses libraries: $out"
  case "$f" in
    "$dest$bindir"/*)
      [ "$(resolved "$soname" <<< "$out")" = "$installed_lib" ] ||
        fail "${f#$dest} does not take $soname from $libdir: $out"
      if [ -n "$runpath" ]; then
        out=$(env -u LD_LIBRARY_PATH ldd "$f" 2>&1)
        [ "$(resolved "$soname" <<< "$out")" = "$installed_lib" ] ||
          fail "${f#$dest}: RUNPATH $runpath does not lead to $libdir/$soname: $out"
      fi
      ;;
  esac
done

# Documentation.
for d in README.md docs/install.md docs/searchd.md; do
  [ -f "$dest$docdir/$d" ] || fail "$docdir/$d missing"
done

# systemd's own check of the units (keys, values, the ExecStart program)
# inside the install; the targets they name are not there, so errors of the
# units they depend on do not count.
if command -v systemd-analyze > /dev/null; then
  out=$(systemd-analyze verify --root="$dest" --recursive-errors=no $(for u in $units; do echo "$unitdir/$u"; done) 2>&1) ||
    fail "systemd-analyze verify refused the units: $out"
  [ -z "$out" ] || fail "systemd-analyze verify complained: $out"
  echo "systemd-analyze verify: units accepted"
else
  echo "systemd-analyze not found: unit verification skipped"
fi
echo "install layout: all checks passed"
