#!/usr/bin/env bash
# The layer check itself: a clean tree passes; each planted upward include,
# and a program including another program, fails with its file and line.
#   tests/scripts/check_layers_test.sh PATH_TO_check_layers.sh
set -uo pipefail
check="$1"
tree=$(mktemp -d)
trap 'rm -rf "$tree"' EXIT
fail() { echo "FAIL: $*" >&2; exit 1; }

plant() {  # plant FILE INCLUDE...: a source whose includes are given
  mkdir -p "$tree/$(dirname "$1")"
  local f="$tree/$1"
  shift
  : > "$f"
  for inc in "$@"; do printf '#include "%s"\n' "$inc" >> "$f"; done
}

plant common/a.cpp common/a.h "json/json.h"
plant sdk/linux/b.cpp sdk/b.h common/a.h
plant fileindex/elastic/c.cpp fileindex/c.h sdk/b.h common/a.h
plant daemons/common/d.cpp fileindex/c.h
plant daemons/searchd/e.cpp daemons/searchd/e.h daemons/common/d.h fileindex/c.h
plant tools/vellis/f.cpp tools/vellis/f.h sdk/b.h
plant tests/common/a_test.cpp daemons/searchd/e.h tests/support/x.h
"$check" "$tree" > /dev/null 2>&1 || fail "a clean tree was refused"

expect_refused() {  # expect_refused FILE INCLUDE LINE
  plant "$1" common/ok.h "$2"
  out=$("$check" "$tree" 2>&1) && fail "$1 including $2 passed"
  grep -q "^$1:2: includes \"$2\"" <<< "$out" || fail "no line for $1 -> $2 in: $out"
  rm "$tree/$1"
}
expect_refused common/up.cpp sdk/b.h
expect_refused common/up.h fileindex/c.h
expect_refused sdk/linux/up.cpp fileindex/elastic/c.h
expect_refused fileindex/up.cpp daemons/common/d.h
expect_refused daemons/common/up.cpp daemons/searchd/e.h
expect_refused tools/vellis/up.cpp daemons/searchd/e.h
expect_refused daemons/searchd/up.cpp tools/vellis/f.h
"$check" "$tree" > /dev/null 2>&1 || fail "the clean tree was refused after the plants"
echo "layer check: all cases pass"
