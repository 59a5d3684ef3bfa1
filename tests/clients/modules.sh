#!/usr/bin/env bash
# Installs what the clients stand on into FOLDER/node_modules; 77 says that it cannot be had here.
#
# usage: modules.sh FOLDER
set -euo pipefail
folder=$1
here=$(cd "$(dirname "$0")" && pwd)
skip() {
    echo "Skipped: $1"
    exit 77
}
command -v node >/dev/null && command -v npm >/dev/null || skip "there is no node with npm"
mkdir -p "$folder"
cmp -s "$here/package.json" "$folder/installed.json" && exit 0
cp "$here/package.json" "$folder/package.json"
# Nothing that comes along is run at its installation.
npm install --prefix "$folder" --ignore-scripts --no-audit --no-fund --no-package-lock --silent \
    --fetch-retries 1 --fetch-timeout 60000 || skip "the npm registry does not answer"
cp "$here/package.json" "$folder/installed.json"
