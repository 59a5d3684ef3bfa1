#!/usr/bin/env bash
# Serves a synthetic archive and has walk.mjs ask for everything in it.
#
# usage: walk.sh KDD NODE_MODULES
#
# 77 says that node or one of its modules is missing.
set -euo pipefail
kdd=$1
export KDD_NODE_MODULES=$2
here=$(cd "$(dirname "$0")" && pwd)
if ! command -v node >/dev/null || [ ! -d "$KDD_NODE_MODULES/dicomweb-client" ]; then
    echo "Skipped: there is no node with dicomweb-client"
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

export KDD_STORE=$folder/store
"$kdd" --quiet sample "$folder/day" --images 200
"$kdd" --quiet add "$folder/day" >/dev/null
mkfifo "$folder/said"
"$kdd" serve --listen 127.0.0.1:0 >"$folder/said" &
server=$!
read -r said <"$folder/said"
node "$here/walk.mjs" "${said##* }/dicom-web"
