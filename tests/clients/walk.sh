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
. "$here/serving.sh"
need node "$KDD_NODE_MODULES/dicomweb-client"

"$kdd" --quiet sample "$folder/day" --images 200
"$kdd" --quiet add "$folder/day" >/dev/null
serve
node "$here/walk.mjs" "$root/dicom-web"
