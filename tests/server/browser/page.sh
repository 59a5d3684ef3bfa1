#!/usr/bin/env bash
# Serves a synthetic archive, in which one patient's name is markup, and has page.mjs walk the study browser.
#
# usage: page.sh KDD [FOLDER FOR PICTURES]
#
# Needs node, Chromium and a folder of node modules with puppeteer-core, named by KDD_NODE_MODULES; 77 says that one of
# them is missing.
set -euo pipefail
kdd=$1
pictures=${2:-}
here=$(cd "$(dirname "$0")" && pwd)

. "$here/../../clients/serving.sh"
need node "${CHROMIUM:-/usr/bin/chromium}" "${KDD_NODE_MODULES:-}/puppeteer-core"

"$kdd" --quiet sample "$folder/day" --images 400
"$kdd" --quiet add "$folder/day" >/dev/null
study=$("$kdd" list | awk '/ OT / && !found {print $1; found = 1}')
image=$("$kdd" --json show "$study" --tree | sed -n 's/.*"image": *"\([0-9.]*\)".*/\1/p' | sed -n 1p)
cat >"$folder/job.xml" <<'XML'
<Job><Timestamp>20240601093000</Timestamp><Login>anna</Login><Substitutions>
<Tag Group="0010" Element="0010"><Value>&lt;img src=x onerror=window.owned=1&gt;</Value></Tag>
<Tag Group="0008" Element="1030"><Value>&lt;script&gt;window.owned=1&lt;/script&gt;</Value></Tag>
</Substitutions></Job>
XML
"$kdd" --quiet qa "$folder/job.xml" --study "$study" --image "$image"

# To be uploaded: three images and one that is cut, what is no object, and a folder with two more.
"$kdd" --quiet sample "$folder/more" --images 60 --seed 9
mkdir -p "$folder/uploads/below"
find "$folder/more" -name '*.dcm' -path '*/CT-1/*' | sort >"$folder/found"
for i in 1 2 3 4 5 6; do
    into=$folder/uploads
    [ "$i" -le 4 ] || into=$folder/uploads/below
    cp "$(sed -n "${i}p" "$folder/found")" "$into/$i.dcm"
done
truncate -s 3000 "$folder/uploads/4.dcm"
cp "$(sed -n 7p "$folder/found")" "$folder/forged.dcm"
echo "no image" >"$folder/uploads/<b>read-me<b>.txt"
{
    head -c 128 /dev/zero
    printf 'DICM\x02\x00\x02\x00UI\x14\x001.2.840.10008.1.3.10'
} >"$folder/uploads/DICOMDIR"

KDD_FREE_SPACE=0 serve --stow --corrections --deletions
node "$here/page.mjs" "$root" "$folder/uploads" "$pictures"
