#!/usr/bin/env bash
# Records what programs built against the shared library rely on, or holds the library against the record.
# usage: abi.sh (record|check) LIBRARY HEADER_FOLDER RECORD
set -euo pipefail
what=$1 library=$2 headers=$3 record=$4

# Only what a program sees, and nothing of where and how it was built, so that a record changes with that alone.
seen=(--exported-interfaces-only --drop-private-types --no-architecture --no-show-locs)

abi_of() {
    abidw --headers-dir "$headers" "${seen[@]}" --no-corpus-path --no-comp-dir-path --no-elf-needed --type-id-style hash "$library"
}

case $what in
    record)
        abi_of | xz -9e >"$record.new"
        mv "$record.new" "$record"
        ;;
    check)
        folder=$(mktemp -d)
        trap 'rm -rf "$folder"' EXIT
        xz -dc "$record" >"$folder/former.abi"
        # Of both what a program sees: a record does not tell where a type was declared, so that held against the library itself
        # each type would count as private.
        abi_of >"$folder/new.abi"
        # What is added does no harm.
        abidiff --no-added-syms "$folder/former.abi" "$folder/new.abi" || {
            cat >&2 <<TXT

Programs built against the recorded library would not run with this one as they did: see above what was removed or
changed. Keep the former beside the new. A change that no program can notice, or one that is meant and comes with a new
first number of the version, is recorded by "./dev abi".
TXT
            exit 1
        }
        ;;
esac
