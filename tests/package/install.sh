#!/usr/bin/env bash
# Installs the packages on this machine, uses them, and removes them again. For machines that are thrown away: it runs as
# root and only where KDD_TEST_INSTALL is 1.
# usage: install.sh FOLDER_OF_PACKAGES FOLDER README
set -euo pipefail
packages=$1 folder=$2 readme=$3
names=(kdd libkdd-dev libkdd-video libkdd0)

if [ "${KDD_TEST_INSTALL:-0}" != 1 ]; then
    echo "Skipped: set KDD_TEST_INSTALL=1 where the packages may be installed"
    exit 77
fi
for name in "${names[@]}"; do
    if dpkg -s "$name" >/dev/null 2>&1; then
        echo "$name is installed already" >&2
        exit 1
    fi
done
trap 'dpkg -r "${names[@]}" >/dev/null' EXIT
dpkg -i "$packages"/*.deb
files=$(dpkg -L "${names[@]}" | grep kdd | sort -u)
kdd --version
for how in cmake pkg-config; do
    "$(dirname "$0")/consumer.sh" $how "" "$folder/$how" "$readme"
done
trap - EXIT
dpkg -r "${names[@]}"

for file in $files; do
    if [ -e "$file" ] || [ -L "$file" ]; then
        echo "$file is left behind" >&2
        exit 1
    fi
done
if ldconfig -p | grep libkdd || dpkg-query -W "${names[@]}" 2>/dev/null; then
    echo "The packages are not gone" >&2
    exit 1
fi
