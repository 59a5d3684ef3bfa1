#!/usr/bin/env bash
# Serves a synthetic archive with a viewer and has viewer.mjs open each kind of study in it.
#
# usage: viewer.sh KDD NODE_MODULES VIEWER [FOLDER [IMAGES [KIND...]]]
#
# VIEWER is a folder that packaging/viewer/prepare.py made. FOLDER receives screenshots; IMAGES is how many the CT has, whose
# first picture is timed (24). 77 says that something of this is missing.
set -euo pipefail
kdd=$1
export KDD_NODE_MODULES=$2
viewer=$3
pictures=${4:-pictures}
images=${5:-24}
here=$(cd "$(dirname "$0")" && pwd)

skip() {
    echo "Skipped: $1"
    exit 77
}
command -v node >/dev/null || skip "there is no node"
[ -x "${CHROMIUM:-/usr/bin/chromium}" ] || skip "there is no Chromium"
[ -d "$KDD_NODE_MODULES/puppeteer-core" ] || skip "$KDD_NODE_MODULES has no puppeteer-core"
[ -e "$viewer/index.html" ] || skip "$viewer holds no viewer; ./dev viewer gets one"

folder=$(mktemp -d)
server=
cleanup() {
    [ -z "$server" ] || kill "$server" 2>/dev/null || true
    [ -z "$server" ] || wait "$server" 2>/dev/null || true
    rm -rf "$folder"
}
trap cleanup EXIT

export KDD_STORE=$folder/store
"$kdd" --quiet sample "$folder/day" --images 400
node "$here/objects.mjs" "$folder/objects" "$images"
"$kdd" --quiet add "$folder/day" "$folder/objects" >/dev/null
mkfifo "$folder/said"
"$kdd" serve --listen 127.0.0.1:0 --viewer "$viewer" >"$folder/said" &
server=$!
read -r said <"$folder/said"
mkdir -p "$pictures"
# The viewer's programs take "localhost" for a secure place.
node "$here/viewer.mjs" "http://localhost:${said##*:}" "$pictures" "${@:6}"
