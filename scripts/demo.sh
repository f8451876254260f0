#!/usr/bin/env bash
# The main job: sets up and builds, then, under a temporary root:
#  1. registers a share, asks which of its paths may be indexed, generates a
#     sample queue of file-change events in the share's queue, folds it with
#     `vellis queue fold`, rotates the queue and asks what is pending;
#  2. starts the search daemon, registers a share holding a sample of real
#     documents (from /usr/share/doc), fills its index through the library's
#     own requests (`vellis index load`) and runs a few searches.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh build
VELLIS=build/bin/vellis

SEARCHD=build/bin/vellis-searchd

export VELLIS_ROOT="$(mktemp -d /tmp/vellis-demo-XXXXXX)"
cleanup() {
  if [ -f "$VELLIS_ROOT/var/run/vellis-searchd.pid" ]; then
    kill "$(cat "$VELLIS_ROOT/var/run/vellis-searchd.pid")" 2>/dev/null || true
    sleep 0.5
  fi
  rm -rf "$VELLIS_ROOT"
}
trap cleanup EXIT
share="$VELLIS_ROOT/volume1/photo"
# A share's index data lives on its own volume: <volume>/@fileindex/<share>/.
queue="$VELLIS_ROOT/volume1/@fileindex/photo/queue"
mkdir -p "$share/2019" "$share/albums" "$share/#recycle" "$(dirname "$queue")"
echo hello > "$share/2019/a.jpg"
echo deleted > "$share/#recycle/x.jpg"
ln -s /etc "$share/etc-link"

echo "== vellis share add / list"
"$VELLIS" share add photo "$share" --recycle-bin
"$VELLIS" share list
echo "== vellis path check: which paths may be indexed"
for p in "$share/2019" "$share/2019/" "$share/etc-link" "$share/#recycle/x.jpg"; do
  printf '%s: ' "${p#$VELLIS_ROOT}"
  "$VELLIS" path check "$p" || true
done
echo "-- as JSON, with the exit status scripts branch on (1: not indexable)"
"$VELLIS" path check "$share/#recycle/x.jpg" --json || echo "exit status $?"
echo "== vellis path type / share"
"$VELLIS" path type "$share/2019/a.jpg"
"$VELLIS" path share "$share/2019/a.jpg"

cat > "$queue" <<QUEUE
{"event":64,"path":"$share/2019/a.jpg"}
{"event":2,"path":"$share/2019/a.jpg"}
{"event":64,"path":"$share/2019/b.jpg"}
{"event":128,"path":"$share/2019/b.jpg"}
{"event":128,"path":"$share/2019/c.jpg"}
{"event":64,"path":"$share/2019/c.jpg"}
{"event":4,"path":"$share/notes.txt"}
{"event":2,"path":"$share/notes.txt"}
{"event":256,"path":"$share/2020","path_old":"$share/2019"}
{"event":64,"is_dir":true,"path":"$share/albums"}
{"event":131072,"path":"$share","data":{"document":true}}
{"event":131072,"path":"$share","data":{"photo":true}}
this line is not JSON
{"event":2,"path":"relative/path.txt"}
QUEUE

echo "== queue: $(wc -l < "$queue") lines"
echo "== vellis -v queue fold (skipped lines are logged; each surviving operation, then the count)"
"$VELLIS" -v queue fold "$queue"
echo "== vellis queue pending (before rotation)"
"$VELLIS" queue pending "$queue" "$share/2020"
echo "== vellis queue rotate"
"$VELLIS" queue rotate "$queue"
ls "$(dirname "$queue")"
echo "== vellis queue pending (the side file still counts)"
"$VELLIS" queue pending "$queue" "$share/2020"

echo
echo "== search: start vellis-searchd (detached, pid file and socket under the root)"
"$SEARCHD"
for _ in $(seq 50); do [ -S "$VELLIS_ROOT/var/run/qoruelasticd.sock" ] && break; sleep 0.1; done
docs="$VELLIS_ROOT/volume1/doc"
mkdir -p "$docs"
# A sample of real documents: text, Markdown and HTML files of the installed
# packages' documentation.
(cd /usr/share/doc && find . -type f \( -name '*.txt' -o -name '*.md' -o -name '*.html' \) \
  | sort | head -400 | while read -r f; do
    mkdir -p "$docs/$(dirname "$f")" && cp "$f" "$docs/$f"
  done)
if [ "$(find "$docs" -type f | wc -l)" -lt 10 ]; then
  # A machine without package documentation: a few documents of our own.
  mkdir -p "$docs/git" "$docs/notes"
  echo "This program is free software under the GNU General Public License." > "$docs/git/README.md"
  echo "To install, run make install; read the license first." > "$docs/git/INSTALL.txt"
  echo "Reading list: the license, the readme and the install notes." > "$docs/notes/readme.txt"
fi
"$VELLIS" share add doc "$docs"
echo "== vellis index load doc"
"$VELLIS" index load doc
echo '== vellis search license --limit 3'
"$VELLIS" search license --limit 3
echo '== vellis search "general public license" --limit 2'
"$VELLIS" search '"general public license"' --limit 2
echo '== vellis search read* --name READ --limit 3  (file names containing "read")'
"$VELLIS" search 'read*' --name READ --limit 3
echo '== vellis search install --category document --path <share>/git --limit 2'
"$VELLIS" search install --category document --path "$docs/git" --limit 2
