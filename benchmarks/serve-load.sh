#!/usr/bin/env bash
# Load on `alarmsearch serve` with an in-memory simulator of 200 000 alarms: builds the server
# and the load client in the default preset, starts the server on a free loopback port, runs the
# client (extra arguments go to it, e.g. --seconds 10 --subscribers 1000) and stops the server.
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/setup.sh
cmake --preset default >/dev/null
cmake --build --preset default --target alarmsearch alarmsearch-serve-load PluginAlarmSearchSrv
ulimit -n "$(ulimit -Hn)"

out=$(mktemp)
trap 'kill "$server" 2>/dev/null || true; rm -f "$out"' EXIT
QT_LOGGING_RULES="alarmsearch.serve.info=false" \
    build/default/bin/alarmsearch serve --memory --seed-count 200000 --listen 127.0.0.1:0 >"$out" &
server=$!
until grep -q '^listening on ' "$out"; do
    kill -0 "$server" 2>/dev/null || { echo "serve did not start" >&2; exit 1; }
    sleep 1
done
url=$(sed -n 's/^listening on //p' "$out")
echo "serve at $url (pid $server), 200000 alarms"
build/default/bin/alarmsearch-serve-load "$url" "$server" "$@"
