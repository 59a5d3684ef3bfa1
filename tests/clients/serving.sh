# Sourced by scripts that need a server with an archive of their own, $folder/store, which is gone when they end.
#
#     need COMMAND|FILE...   skips the script, 77, where one is missing
#     serve [OPTION...]      starts `$kdd serve` on a free port of loopback; $root is its address
#     stop                   ends it and waits; how it ended is how this ends

need() {
    local each
    for each in "$@"; do
        command -v "$each" >/dev/null || [ -e "$each" ] || {
            echo "Skipped: there is no $each"
            exit 77
        }
    done
}

folder=$(mktemp -d)
server=
stop() {
    local ended=$server
    server=
    [ -n "$ended" ] || return 0
    kill "$ended"
    wait "$ended"
}
trap 'stop || true; rm -rf "$folder"' EXIT

export KDD_STORE=$folder/store
serve() {
    local said
    mkfifo "$folder/said"
    "$kdd" serve --listen 127.0.0.1:0 "$@" >"$folder/said" &
    server=$!
    read -r said <"$folder/said"
    rm "$folder/said"
    root=${said##* }
}
