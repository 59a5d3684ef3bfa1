#!/usr/bin/env bash
# How kdd get stands beside curl and aria2c: one large object from nginx on this machine, directly, over a link with a
# round trip of 20 ms, and from a server that limits each connection. Every copy is held against the original.
#
#     bench/transfers.sh BUILD-FOLDER [MIB] [ROUNDS]
set -euo pipefail
export LC_ALL=C  # times and rates with a decimal point
build=$(cd "$1" && pwd)
mib=${2:-1024}
rounds=${3:-3}
for tool in nginx curl aria2c /usr/bin/time; do
    command -v "$tool" >/dev/null || { echo "transfers: $tool is missing (apt-get install nginx-light curl aria2 time)"; exit 1; }
done

folder=$(mktemp -d)
# The copies go to memory where there is some, so that the disk is not what is measured.
target=$(mktemp -d -p "$([ -w /dev/shm ] && echo /dev/shm || echo "$folder")")
pids=()
cleanup() {
    kill "${pids[@]}" 2>/dev/null || true
    rm -rf "$folder" "$target"
}
trap cleanup EXIT

mkdir "$folder/files"
head -c $((mib * 1024 * 1024)) /dev/zero | openssl enc -aes-128-ctr -pass pass:transfers -nosalt 2>/dev/null >"$folder/files/object"
cat >"$folder/nginx.conf" <<CONF
daemon off; pid pid; error_log log; worker_processes 1; events {}
http { access_log off; sendfile on; root files;
client_body_temp_path 1; proxy_temp_path 2; fastcgi_temp_path 3; uwsgi_temp_path 4; scgi_temp_path 5;
server { listen 127.0.0.1:18431; }
server { listen 127.0.0.1:18432; limit_rate 20m; } }
CONF
if [ "$(id -u)" -eq 0 ]; then sed -i '1i user root root;' "$folder/nginx.conf"; fi
nginx -e log -c nginx.conf -p "$folder/" &
pids+=($!)
"$build/bench/delay_proxy" 18433 18431 20 &
pids+=($!)
sleep 1

# measure LABEL COMMAND...: the fastest of the rounds
measure() {
    local label=$1 best='' line
    shift
    for _ in $(seq "$rounds"); do
        rm -f "$target"/*
        line=$(/usr/bin/time -f '%e %U %S %M' "$@" 2>&1 >/dev/null | tail -1)
        cmp -s "$target/object" "$folder/files/object" || { echo "$label: the copy differs"; exit 1; }
        best=$(printf '%s\n%s\n' "$best" "$line" | sed '/^$/d' | sort -n | head -1)
    done
    awk -v label="$label" -v mib="$mib" \
        '{printf "%-34s %7.0f MiB/s   %5.2f s CPU/GiB   %6.0f MiB memory\n", label, mib/$1, ($2+$3)*1024/mib, $4/1024}' <<<"$best"
}

kdd=$build/src/tools/kdd/kdd
for link in "direct:18431" "20 ms:18433" "20 MiB/s per connection:18432"; do
    url=http://127.0.0.1:${link##*:}/object
    name=${link%:*}
    measure "$name, curl" curl -s -o "$target/object" "$url"
    measure "$name, aria2c, 8 connections" aria2c -q -x8 -s8 -k1M -d "$target" -o object "$url"
    for ranges in 1 2 4 8; do
        measure "$name, kdd, $ranges" "$kdd" --quiet get --parallel "$ranges" -o "$target" "$url"
    done
done
