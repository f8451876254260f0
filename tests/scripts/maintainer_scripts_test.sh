#!/usr/bin/env bash
# The Debian package's maintainer scripts (packaging/debian), run with stub
# systemctl, deb-systemd-helper and deb-systemd-invoke that record their
# calls: with and without a running systemd (an empty /run, or one with
# /run/systemd/system, in a mount namespace of their own), with failing
# tools, without the tools, and for an install into another root. They must
# always succeed and touch systemd only where it runs.
#   tests/scripts/maintainer_scripts_test.sh PACKAGING_DIR
# Exits 77 (skipped) when no mount namespace can be made.
set -uo pipefail
packaging="$1"
debian="$packaging/debian"
fail() { echo "FAIL: $*" >&2; exit 1; }

# Re-run inside a private mount namespace, where /run can be replaced.
if [ -z "${VELLIS_MAINT_NS:-}" ]; then
  for unshare_args in "-m" "-rm"; do
    if unshare $unshare_args true 2>/dev/null; then
      exec env VELLIS_MAINT_NS=1 unshare $unshare_args --propagation private "$0" "$@"
    fi
  done
  echo "SKIP: no mount namespace (unshare -m) here"
  exit 77
fi
mount -t tmpfs vellis-run /run || fail "cannot mount a tmpfs on /run"

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
stubs="$work/stubs"
log="$work/calls"
mkdir -p "$stubs"
for tool in systemctl deb-systemd-helper deb-systemd-invoke; do
  cat > "$stubs/$tool" <<'STUB'
#!/bin/sh
echo "${0##*/} $*" >> "$STUB_LOG"
[ "$1 $2" = "--quiet was-enabled" ] && exit "${STUB_WAS_ENABLED:-0}"
exit "${STUB_STATUS:-0}"
STUB
  chmod +x "$stubs/$tool"
done

UNITS="vellis-searchd.service vellis-fileindexd.service vellis-monitord.service"
# The scripts must name every unit the package installs, and no other.
shipped=$(cd "$packaging/systemd" && ls *.service.in | sed 's/\.in$//' | sort)
for script in postinst prerm postrm; do
  [ -x "$debian/$script" ] || fail "$script missing or not executable"
  named=$(sed -n 's/^UNITS="\(.*\)"$/\1/p' "$debian/$script" | tr ' ' '\n' | sort)
  [ "$named" = "$shipped" ] || fail "$script names units [$named], the package ships [$shipped]"
done

systemd_running() {
  if [ "$1" = yes ]; then mkdir -p /run/systemd/system; else rm -rf /run/systemd; fi
}

# run SCRIPT ARGS...: runs the script with the stubs (the tools present in
# $TOOLS) as the only programs on PATH; the calls land in $log.
run() {
  local script="$1"
  shift
  local path="$work/path"
  rm -rf "$path"
  mkdir -p "$path"
  for tool in ${TOOLS-systemctl deb-systemd-helper deb-systemd-invoke}; do
    ln -s "$stubs/$tool" "$path/$tool"
  done
  : > "$log"
  env -i PATH="$path" STUB_LOG="$log" STUB_STATUS="${STUB_STATUS:-0}" \
      STUB_WAS_ENABLED="${STUB_WAS_ENABLED:-0}" ${DPKG_ROOT+DPKG_ROOT="$DPKG_ROOT"} \
      /bin/sh "$debian/$script" "$@" > "$work/out" 2>&1 ||
    fail "$script $* exited with $? ($(cat "$work/out"))"
}

expect_calls() {  # expect_calls WHAT EXPECTED_LINES
  local got
  got=$(cat "$log")
  [ "$got" = "$2" ] || fail "$1: calls were
$got
expected
$2"
}

# Where systemd does not run: only deb-systemd-helper (which needs no running
# systemd) is called; a first install enables both units.
systemd_running no
run postinst configure
expect_calls "postinst without systemd" "deb-systemd-helper unmask vellis-searchd.service
deb-systemd-helper --quiet was-enabled vellis-searchd.service
deb-systemd-helper enable vellis-searchd.service
deb-systemd-helper unmask vellis-fileindexd.service
deb-systemd-helper --quiet was-enabled vellis-fileindexd.service
deb-systemd-helper enable vellis-fileindexd.service
deb-systemd-helper unmask vellis-monitord.service
deb-systemd-helper --quiet was-enabled vellis-monitord.service
deb-systemd-helper enable vellis-monitord.service"
run prerm remove
expect_calls "prerm without systemd" ""
run postrm remove
expect_calls "postrm remove without systemd" "deb-systemd-helper mask $UNITS"
run postrm purge
expect_calls "postrm purge without systemd" "deb-systemd-helper purge $UNITS
deb-systemd-helper unmask $UNITS"

# No tools at all (a minimal system): nothing to call, and no failure.
TOOLS="" run postinst configure
TOOLS="" run prerm remove
TOOLS="" run postrm purge

# Where systemd runs: reload, then start on a first install, restart on an
# upgrade; an administrator's "disable" is kept (was-enabled false).
systemd_running yes
run postinst configure
expect_calls "postinst with systemd" "deb-systemd-helper unmask vellis-searchd.service
deb-systemd-helper --quiet was-enabled vellis-searchd.service
deb-systemd-helper enable vellis-searchd.service
deb-systemd-helper unmask vellis-fileindexd.service
deb-systemd-helper --quiet was-enabled vellis-fileindexd.service
deb-systemd-helper enable vellis-fileindexd.service
deb-systemd-helper unmask vellis-monitord.service
deb-systemd-helper --quiet was-enabled vellis-monitord.service
deb-systemd-helper enable vellis-monitord.service
systemctl --system daemon-reload
deb-systemd-invoke start $UNITS"
STUB_WAS_ENABLED=1 run postinst configure 0.0.9
expect_calls "postinst upgrade of disabled units" "deb-systemd-helper unmask vellis-searchd.service
deb-systemd-helper --quiet was-enabled vellis-searchd.service
deb-systemd-helper update-state vellis-searchd.service
deb-systemd-helper unmask vellis-fileindexd.service
deb-systemd-helper --quiet was-enabled vellis-fileindexd.service
deb-systemd-helper update-state vellis-fileindexd.service
deb-systemd-helper unmask vellis-monitord.service
deb-systemd-helper --quiet was-enabled vellis-monitord.service
deb-systemd-helper update-state vellis-monitord.service
systemctl --system daemon-reload
deb-systemd-invoke restart $UNITS"
run prerm remove
expect_calls "prerm remove with systemd" \
  "deb-systemd-invoke stop vellis-monitord.service vellis-fileindexd.service vellis-searchd.service"
run prerm upgrade 0.2.0
expect_calls "prerm upgrade" ""
run postrm remove
expect_calls "postrm remove with systemd" "systemctl --system daemon-reload
deb-systemd-helper mask $UNITS"

# systemctl alone (no Debian helpers): it enables, starts, stops, disables.
TOOLS="systemctl" run postinst configure
expect_calls "postinst with systemctl only" "systemctl --system daemon-reload
systemctl enable $UNITS
systemctl start $UNITS"
TOOLS="systemctl" run prerm remove
expect_calls "prerm with systemctl only" "systemctl stop vellis-monitord.service vellis-fileindexd.service vellis-searchd.service
systemctl disable vellis-monitord.service vellis-fileindexd.service vellis-searchd.service"

# Every tool failing: the scripts still succeed (run() fails otherwise).
for script_args in "postinst configure" "postinst configure 0.0.9" "prerm remove" \
                   "postrm remove" "postrm purge"; do
  STUB_STATUS=1 run $script_args
  [ -s "$log" ] || fail "$script_args called nothing with systemd running"
  STUB_STATUS=1 TOOLS="systemctl" run $script_args
done

# An install into another root never touches the running systemd.
DPKG_ROOT="$work/otherroot" run postinst configure
if grep -q "^systemctl\|^deb-systemd-invoke" "$log"; then
  fail "postinst with DPKG_ROOT called: $(cat "$log")"
fi
DPKG_ROOT="$work/otherroot" run prerm remove
expect_calls "prerm with DPKG_ROOT" ""

echo "maintainer scripts: all cases passed"
