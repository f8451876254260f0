#!/usr/bin/env bash
# The main job: sets up and builds, then, under a temporary root, registers a
# share, asks which of its paths may be indexed, generates a sample queue of
# file-change events in the share's queue and folds it with `vellis queue
# fold`, rotates the queue and asks what is pending.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh build
VELLIS=build/tools/vellis/vellis

export VELLIS_ROOT="$(mktemp -d /tmp/vellis-demo-XXXXXX)"
trap 'rm -rf "$VELLIS_ROOT"' EXIT
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
