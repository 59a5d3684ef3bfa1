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
. "$here/serving.sh"
need node curl "$KDD_NODE_MODULES/dicomweb-client"

export KDD_FREE_SPACE=0
"$kdd" --quiet sample "$folder/day" --images 60
# Volume files are made by the archive and are not sent.
find "$folder/day" -type f -name '*.vol*' -delete
serve --stow
node "$here/store.mjs" "$root/dicom-web" "$folder/day"
object=$(find "$folder/store/objects" -name '*.dcm' -print -quit)
for how in "Transfer-Encoding: chunked" "Expect: 100-continue"; do
    curl -sS -f -H "Content-Type: application/dicom" -H "$how" --data-binary "@$object" -o "$folder/answer" "$root/dicom-web/studies"
    grep -q 00081199 "$folder/answer"
done
stop

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
