#!/usr/bin/env bash
# The main job: sets up and builds, then, under a temporary root, generates a
# sample queue of file-change events and folds it with `vellis queue fold`,
# rotates a live queue and asks what is pending.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup.sh build
VELLIS=build/tools/vellis/vellis

export VELLIS_ROOT="$(mktemp -d /tmp/vellis-demo-XXXXXX)"
trap 'rm -rf "$VELLIS_ROOT"' EXIT
share="$VELLIS_ROOT/volume1/photo"
queue="$VELLIS_ROOT/volume1/@fileindex/photo.queue"
mkdir -p "$share" "$(dirname "$queue")"

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
