#!/usr/bin/env bash
# Makes the packages of a build, looks into them, and unpacks them into a folder as if that were the root of a machine.
# usage: packages.sh CPACK BUILD_FOLDER FOLDER MATERIALS
set -euo pipefail
cpack=$1 build=$2 folder=$3 materials=$4
root=$folder/root

fail() { echo "$*" >&2; exit 1; }

rm -rf "$folder"
mkdir -p "$root"
"$cpack" --config "$build/CPackConfig.cmake" -B "$folder" >"$folder/cpack.log" 2>&1 || {
    cat "$folder/cpack.log"
    exit 1
}

# package NAME: its file, of which there is one.
package() {
    local files=("$folder/$1"_*.deb)
    [ -e "${files[0]}" ] && [ ${#files[@]} -eq 1 ] || fail "There is not one package $1"
    echo "${files[0]}"
}

# depends NAME FIELD PATTERN
depends() { dpkg-deb -f "$(package "$1")" "$2" | grep -Eq "$3" || fail "$1: $2 does not name $3"; }

for name in libkdd0 libkdd-dev kdd libkdd-video; do
    dpkg -x "$(package "$name")" "$root"
    [ -s "$root/usr/share/doc/$name/copyright" ] || fail "$name tells no licences"
done
depends libkdd0 Depends 'libqt5sql5-sqlite'
depends libkdd0 Depends 'libhdf5'
depends libkdd0 Recommends 'libqt5sql5-psql.*libkdd-video'
depends libkdd-dev Depends 'libkdd0 \(= .*libboost-dev.*libdcmtk-dev.*qtbase5-dev'
depends kdd Depends 'libkdd0 \(= '
depends libkdd-video Depends 'libavcodec'
for name in libkdd0 libkdd-dev kdd; do
    ! dpkg-deb -f "$(package "$name")" Depends | grep -q libav || fail "$name needs FFmpeg"
done
# Nothing runs when packages come or go but ldconfig, so that nothing of them stays either.
for name in libkdd0 libkdd-dev kdd libkdd-video; do
    scripts=$(dpkg-deb --ctrl-tarfile "$(package "$name")" | tar -t | grep -E '(pre|post)(inst|rm)$' || true)
    [ -z "$scripts" ] || fail "$name has scripts: $scripts"
done
dpkg-deb -I "$(package libkdd0)" triggers | grep -qx 'activate-noawait ldconfig' || fail "libkdd0 does not tell ldconfig"

# starts UNIT COMMAND
starts() {
    grep -qx "ExecStart=/usr/bin/kdd $2" "$root/usr/lib/systemd/system/$1" || fail "$1 does not start the tool"
    if [ -d /run/systemd/system ]; then
        systemd-analyze verify --root="$root" "${1/@/@8042}" || fail "$1 is not well formed"
    fi
}
starts kdd-serve.service '--flush serve'
starts kdd-serve@.service '--flush serve --listen 127.0.0.1:%i --status 127.0.0.1:1%i'
starts kdd-build.service '--flush --quiet build --forever'
[ -s "$root/usr/share/doc/kdd/examples/kdd.ini" ] && [ -s "$root/usr/lib/sysusers.d/kdd.conf" ] ||
    fail "The service has no user or no settings to begin with"

headers=$root/usr/include/kddlib
[ -z "$(find "$headers" -mindepth 1 -type d)" ] || fail "Installed headers lie in folders"
! grep -rn '#include "' "$headers" || fail "An installed header names a folder of the source"
! grep -rIl "$build" "$root/usr" || fail "These know where they were built"
for file in "$root"/usr/bin/kdd "$root"/usr/lib/*/libkdd.so.0 "$root"/usr/lib/*/kddlib/*; do
    grep -q BIND_NOW <<<"$(readelf -dW "$file")" || fail "$file resolves names after its start"
    ! readelf -d "$file" | grep -E 'R(UN)?PATH' | grep -v '\[\$ORIGIN/' || fail "$file looks for libraries elsewhere"
done

decoder=$(echo "$root"/usr/lib/*/kddlib/kdd-decoder)
[ -x "$decoder" ] || fail "There is no decoder"
# Nobody but the library starts it.
"$decoder" frames </dev/null 2>/dev/null && fail "The decoder decodes for anybody"
[ $? -eq 2 ] || fail "The decoder cannot be started"
for file in "$root"/usr/lib/*/libkdd.so.0 "$decoder" "$root"/usr/lib/*/kddlib/kdd-tool.so; do
    grep -q __stack_chk_fail <<<"$(readelf --dyn-syms -W "$file")" || fail "$file does not watch its stack"
done

"$materials" "$build" >"$folder/materials.json"
for name in libavcodec59 libdcmtk17 libhdf5-103-1 libqt5core5a libssl3; do
    grep -A1 "\"name\": \"$name\"" "$folder/materials.json" | grep -q '"version": "[0-9]' ||
        fail "The bill of materials does not tell the version of $name"
done

"$root/usr/bin/kdd" --version
# What reading a tag file does not need is not there at the start.
loaded=$(ldd "$root/usr/bin/kdd")
for name in Qt5Gui Qt5Sql crypto curl dcmjpeg dcmnet hdf5 isal openjp2 pq; do
    ! grep -E "lib$name[._]" <<<"$loaded" || fail "The tool starts with $name"
done
