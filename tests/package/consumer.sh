#!/usr/bin/env bash
# Builds the program in consumer/ against the package that is unpacked below ROOT, the way the README tells, and runs it.
# usage: consumer.sh (cmake|pkg-config) ROOT FOLDER README
set -euo pipefail
how=$1 root=$2 folder=$3 readme=$4
source=$(cd "$(dirname "$0")" && pwd)/consumer

# block LANGUAGE: the first code block of that language in the README.
block() { sed -n "/^\`\`\`$1\$/,/^\`\`\`\$/p" "$readme" | sed '1d;/^```$/,$d'; }

rm -rf "$folder"
mkdir -p "$folder/archive"
cp "$source"/* "$folder"
cd "$folder"
libraries=$(dirname "$(find "$root/usr/lib" -name libkdd.so)")
case $how in
    cmake)
        block cmake | diff - CMakeLists.txt || {
            echo "The README shows another CMakeLists.txt" >&2
            exit 1
        }
        CMAKE_PREFIX_PATH=$root/usr cmake -B build -G Ninja -DCMAKE_BUILD_TYPE=Release . >configure.log || {
            cat configure.log
            exit 1
        }
        cmake --build build
        program=build/server
        ;;
    pkg-config)
        export PKG_CONFIG_PATH=$libraries/pkgconfig
        block sh >build.sh
        grep -q 'pkg-config .*kddlib' build.sh
        sh -ex build.sh
        export LD_LIBRARY_PATH=$libraries
        program=./server
        ;;
esac
found=$(ldd "$program" | awk '/libkdd.so.0/ {print $3}')
[ "$(realpath "$found")" = "$(realpath "$libraries/libkdd.so.0")" ] || {
    echo "$program runs with another library: $found" >&2
    exit 1
}
"$program" "$folder/archive"
