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

. "$here/serving.sh"
need node "${CHROMIUM:-/usr/bin/chromium}" "$KDD_NODE_MODULES/puppeteer-core" "$viewer/index.html"

"$kdd" --quiet sample "$folder/day" --images 400
node "$here/objects.mjs" "$folder/objects" "$images"
# This one comes in by the viewer.
mv "$folder/objects/xa.dcm" "$folder/upload.dcm"
"$kdd" --quiet add "$folder/day" "$folder/objects" >/dev/null
mkdir -p "$pictures"
# The viewer's programs take "localhost" for a secure place.
look() { node "$here/viewer.mjs" "http://localhost:${root##*:}" "$pictures" "$folder/upload.dcm" "$@"; }
serve --viewer "$viewer"
look reading
stop
KDD_FREE_SPACE=0 serve --stow --viewer "$viewer"
look "${@:6}"
