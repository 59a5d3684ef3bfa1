#!/usr/bin/env bash
# Has signin.mjs bring an object into an empty archive at which people sign in.
#
# usage: signin.sh KDD
#
# Needs what page.sh needs; 77 says that something of it is missing.
set -euo pipefail
kdd=$1
here=$(cd "$(dirname "$0")" && pwd)

. "$here/../../clients/serving.sh"
need node "${CHROMIUM:-/usr/bin/chromium}" "${KDD_NODE_MODULES:-}/puppeteer-core"

"$kdd" --quiet sample "$folder/day" --images 20
find "$folder/day" -name '*.dcm' | sort >"$folder/found"
KDD_FREE_SPACE=0 node "$here/signin.mjs" "$kdd" "$folder" "$(sed -n 1p "$folder/found")"
