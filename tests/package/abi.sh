#!/usr/bin/env bash
# Records what programs built against the shared library rely on, or holds the library against the record.
# usage: abi.sh (record|check) LIBRARY HEADER_FOLDER RECORD
set -euo pipefail
what=$1 library=$2 headers=$3 record=$4

# Only what a program sees, and nothing of where and how it was built, so that a record changes with that alone.
seen=(--exported-interfaces-only --drop-private-types --no-architecture --no-show-locs)

case $what in
    record)
        abidw --headers-dir "$headers" "${seen[@]}" --no-corpus-path --no-comp-dir-path --no-elf-needed \
            --type-id-style hash "$library" | xz -9e >"$record.new"
        mv "$record.new" "$record"
        ;;
    check)
        former=$(mktemp --suffix=.abi)
        trap 'rm -f "$former"' EXIT
        xz -dc "$record" >"$former"
        # What is added does no harm.
        abidiff --headers-dir2 "$headers" "${seen[@]}" --no-added-syms "$former" "$library" || {
            cat >&2 <<TXT

Programs built against the recorded library would not run with this one as they did: see above what was removed or
changed. Keep the former beside the new. A change that no program can notice, or one that is meant and comes with a new
first number of the version, is recorded by "./dev abi".
TXT
            exit 1
        }
        ;;
esac
