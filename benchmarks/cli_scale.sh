#!/usr/bin/env bash
# Measures the command-line client at scale against its embedded simulated server, with
# databases seeded once under a scratch folder (BENCH_DIR, default /tmp/alarmsearch-bench):
# - peak resident memory of `query --all --format jsonl` at 1 000 000 alarms against that at
#   10 000 (target: at most 1.2 times);
# - the time of `export` of 200 000 alarms against that of `query --all` over the same range
#   (target: at most 2 times), the best of RUNS runs each (default 1).
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/setup.sh
cmake --preset default >/dev/null
cmake --build --preset default --target alarmsearch PluginAlarmSearchSrv >/dev/null
cli="$PWD/build/default/bin/alarmsearch"
dir="${BENCH_DIR:-/tmp/alarmsearch-bench}"
runs="${RUNS:-1}"
mkdir -p "$dir"

# Seeds a database of $1 alarms once; the seeding run is not measured.
database() {
    local db="$dir/alarms-$1.sqlite"
    [ -f "$db" ] || "$cli" --db "$db" --seed-count "$1" query --from now --format jsonl \
        >/dev/null 2>&1
    echo "$db"
}

# Runs a command with its output thrown away; prints "<seconds> <peak KiB>", the best of $runs.
measure() {
    local best_time="" best_rss="" time rss
    for _ in $(seq "$runs"); do
        /usr/bin/time -o "$dir/time.txt" -f '%e %M' "$@" >/dev/null 2>/dev/null
        read -r time rss <"$dir/time.txt"
        if [ -z "$best_time" ] || awk -v a="$time" -v b="$best_time" 'BEGIN{exit !(a<b)}'; then
            best_time=$time
        fi
        if [ -z "$best_rss" ] || [ "$rss" -lt "$best_rss" ]; then best_rss=$rss; fi
    done
    echo "$best_time $best_rss"
}

small=$(database 10000)
large=$(database 1000000)
read -r _ rss_small < <(measure "$cli" --db "$small" query --all --format jsonl)
read -r _ rss_large < <(measure "$cli" --db "$large" query --all --format jsonl)
awk -v s="$rss_small" -v l="$rss_large" 'BEGIN {
    printf "peak RSS, query --all --format jsonl: %d KiB at 10 000 alarms, %d KiB at 1 000 000\n", s, l
    printf "  ratio %.2f (target <= 1.20): %s\n", l / s, (l / s <= 1.2 ? "met" : "NOT met") }'

export_db=$(database 200000)
read -r query_time _ < <(measure "$cli" --db "$export_db" query --all --format jsonl)
read -r export_time _ < <(measure "$cli" --db "$export_db" export --format csv -o "$dir/export.csv")
awk -v q="$query_time" -v e="$export_time" 'BEGIN {
    printf "200 000 alarms: query --all %.2f s, export %.2f s\n", q, e
    printf "  ratio %.2f (target <= 2.00): %s\n", e / q, (e / q <= 2 ? "met" : "NOT met") }'
