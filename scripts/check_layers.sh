#!/usr/bin/env bash
# Fails when a source includes a header of a higher layer.
#   scripts/check_layers.sh [ROOT]      (ROOT: the repository, default: this one)
# Layers, lowest first: common/ < sdk/ < fileindex/ (with fileindex/elastic/)
# < daemons/common/ < the programs (daemons/<name>/, tools/<name>/). A
# program may include the layers below it and its own folder, never another
# program's. tests/ and bench/ may include anything.
set -euo pipefail
root="${1:-$(cd "$(dirname "$0")/.." && pwd)}"
cd "$root"

# The layer of a path: "<rank> <unit>", the unit naming a program's folder.
layer() {
  case "$1" in
    common/*) echo "0 common" ;;
    sdk/*) echo "1 sdk" ;;
    fileindex/*) echo "2 fileindex" ;;
    daemons/common/*) echo "3 daemons/common" ;;
    daemons/*/* | tools/*/*) echo "4 $(echo "$1" | cut -d/ -f1-2)" ;;
    *) echo "" ;;
  esac
}

status=0
while IFS= read -r file; do
  from=$(layer "$file")
  [ -n "$from" ] || continue
  while IFS=: read -r line target; do
    to=$(layer "$target")
    [ -n "$to" ] || continue  # system headers, tests/, generated files
    if [ "${to%% *}" -gt "${from%% *}" ] ||
       { [ "${to%% *}" -eq 4 ] && [ "${to#* }" != "${from#* }" ]; }; then
      echo "$file:$line: includes \"$target\" (${to#* }) from ${from#* }: a layer may include only the layers below it" >&2
      status=1
    fi
  done < <(grep -n -E '^[[:space:]]*#[[:space:]]*include[[:space:]]+"' "$file" |
           sed -E 's/^([0-9]+):[^"]*"([^"]+)".*/\1:\2/')
done < <(find common sdk fileindex daemons tools -type f \( -name '*.h' -o -name '*.cpp' \) 2>/dev/null | sort)

[ "$status" -eq 0 ] && echo "layers: no upward include"
exit "$status"
