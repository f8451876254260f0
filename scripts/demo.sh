#!/usr/bin/env bash
# The main job: sets up and builds, then, under a temporary root, runs the
# service as a user would:
#  1. starts the daemons (`vellis services start`);
#  2. registers a share holding a sample of real documents (from
#     /usr/share/doc) and generated files of several types, adds it as an
#     indexed folder, and follows the indexing until it is finished;
#  3. runs a few searches;
#  4. edits a file, renames a folder and deletes a file while the service
#     runs, and shows that the searches follow;
#  5. stops the daemons.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh build
VELLIS="$PWD/build/bin/vellis"

export VELLIS_ROOT="$(mktemp -d /tmp/vellis-demo-XXXXXX)"
cleanup() {
  "$VELLIS" services stop > /dev/null 2>&1 || true
  rm -rf "$VELLIS_ROOT"
}
trap cleanup EXIT
step() { printf '\n== %s\n' "$*"; }

step "vellis services start"
"$VELLIS" services start

docs="$VELLIS_ROOT/volume1/docs"
mkdir -p "$docs"
# Real documents: the text, Markdown and HTML files of the installed
# packages' documentation.
(cd /usr/share/doc && find . -type f \( -name '*.txt' -o -name '*.md' -o -name '*.html' \) \
  | sort | head -400 | while read -r f; do
    mkdir -p "$docs/manuals/$(dirname "$f")" && cp "$f" "$docs/manuals/$f"
  done) || true
# Generated files of other kinds: notes, tables, data, pages, and pictures
# (found by name and type, their bytes are not text).
mkdir -p "$docs/projects/orchard" "$docs/projects/harbour" "$docs/photos/2025"
for i in $(seq 1 40); do
  printf 'Meeting notes %d\nThe orchard project plants %d apple trees this season.\n' \
    "$i" "$((i * 7))" > "$docs/projects/orchard/notes-$i.txt"
  printf 'week,crates,quince\n%d,%d,%d\n' "$i" "$((i * 3))" "$((i % 5))" \
    > "$docs/projects/harbour/tally-$i.csv"
done
printf '{"project": "harbour", "berths": 12, "keeper": "lighthouse"}\n' \
  > "$docs/projects/harbour/config.json"
printf '<html><body><h1>Harbour</h1><p>The lighthouse keeper logs every ship.</p></body></html>\n' \
  > "$docs/projects/harbour/index.html"
for i in $(seq 1 10); do head -c 2048 /dev/urandom > "$docs/photos/2025/IMG_$i.jpg"; done
echo "sample: $(find "$docs" -type f | wc -l) files in $(find "$docs" -type d | wc -l) folders"

step "vellis share add docs <folder>; vellis folder add /docs"
"$VELLIS" share add docs "$docs"
"$VELLIS" folder add /docs
step "vellis status --watch (until every folder is finished)"
"$VELLIS" status --watch --timeout 300
step "vellis status"
"$VELLIS" status

step 'vellis search license --limit 3'
"$VELLIS" search license --limit 3
step 'vellis search "apple trees" --limit 2'
"$VELLIS" search '"apple trees"' --limit 2
step 'vellis search lighthouse'
"$VELLIS" search lighthouse
step 'vellis search "" --name img_1 --category image  (pictures, found by name)'
"$VELLIS" search '' --name img_1 --category image --limit 3

step "changes while the service runs: edit a note, rename a folder, delete a page"
echo "The orchard now grows medlar trees as well." >> "$docs/projects/orchard/notes-1.txt"
mv "$docs/projects/harbour" "$docs/projects/port"
rm "$docs/projects/port/index.html"
# The file-change monitor reports each change to the share's queue; the
# indexing daemon takes them after a second of quiet.
sleep 1.5
"$VELLIS" status --watch --timeout 60
step 'vellis search medlar  (the edit)'
"$VELLIS" search medlar
step 'vellis search quince --limit 2  (the renamed folder: every tally is under port/)'
"$VELLIS" search quince --limit 2
step 'vellis search lighthouse  (the page is gone; the data file stays)'
"$VELLIS" search lighthouse

step "vellis services status; vellis services stop"
"$VELLIS" services status
"$VELLIS" services stop
