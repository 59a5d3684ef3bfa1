#!/usr/bin/env bash
# Has store.mjs send synthetic studies to a server, and curl one object, and compares what came of it with what `kdd add` makes
# of the same files.
#
# usage: store.sh KDD NODE_MODULES
#
# 77 says that node or one of its modules is missing.
set -euo pipefail
kdd=$1
export KDD_NODE_MODULES=$2
here=$(cd "$(dirname "$0")" && pwd)
if ! command -v node >/dev/null || ! command -v curl >/dev/null || [ ! -d "$KDD_NODE_MODULES/dicomweb-client" ]; then
    echo "Skipped: there is no node with dicomweb-client, or no curl"
    exit 77
fi

folder=$(mktemp -d)
server=
cleanup() {
    [ -z "$server" ] || kill "$server" 2>/dev/null || true
    [ -z "$server" ] || wait "$server" 2>/dev/null || true
    rm -rf "$folder"
}
trap cleanup EXIT

export KDD_STORE=$folder/store KDD_FREE_SPACE=0
"$kdd" --quiet sample "$folder/day" --images 60
# Volume files are made by the archive and are not sent.
find "$folder/day" -type f -name '*.vol*' -delete
mkfifo "$folder/said"
"$kdd" serve --stow --listen 127.0.0.1:0 >"$folder/said" &
server=$!
read -r said <"$folder/said"
root=${said##* }/dicom-web
node "$here/store.mjs" "$root" "$folder/day"
object=$(find "$folder/store/objects" -name '*.dcm' -print -quit)
for how in "Transfer-Encoding: chunked" "Expect: 100-continue"; do
    curl -sS -f -H "Content-Type: application/dicom" -H "$how" --data-binary "@$object" -o "$folder/answer" "$root/studies"
    grep -q 00081199 "$folder/answer"
done
kill "$server"
wait "$server"
server=

"$kdd" --quiet build --all --settle >/dev/null
"$kdd" verify --all
stored=$("$kdd" --json list | grep -o '"images":[0-9]*' | sort)
export KDD_STORE=$folder/other
"$kdd" --quiet add "$folder/day" >/dev/null
added=$("$kdd" --json list | grep -o '"images":[0-9]*' | sort)
if [ "$stored" != "$added" ]; then
    echo "Sent: $stored; added: $added"
    exit 1
fi
