#!/usr/bin/env bash
# Store benchmark on a generated legacy database of about 1 GiB with 200,000
# messages, one folder holding 10,000 of them. Ratios against baselines
# measured in the same run.
#
#   bench/store.sh [BUILD_DIR] [WORK_DIR]
set -euo pipefail
BUILD=${1:-build}
WORK=${2:-$(mktemp -d /tmp/tarnwell-store-bench.XXXXXX)}
FORGE=$BUILD/testing/exchange/tarnwell-forge-exchange
TARNWELL=$BUILD/cli/tarnwell
ITEMS=$BUILD/bench/tarnwell-bench-store
BIG=$WORK/big.edb
SMALL=$WORK/small.edb
mkdir -p "$WORK"

[ -f "$BIG" ] || "$FORGE" "$BIG" --version 2 --messages 200000 --large-folder 10000 --size-mib 1024 --seed 3 --manifest "$WORK/big.json" >/dev/null
[ -f "$SMALL" ] || "$FORGE" "$SMALL" --version 2 --messages 2000 --large-folder 100 --seed 3 --manifest "$WORK/small.json" >/dev/null

count() { /usr/bin/python3 -c "import json,sys; print(json.load(open(sys.argv[1]))['messages'])" "$1"; }
big_msgs=$(count "$WORK/big.json")
small_msgs=$(count "$WORK/small.json")
# The bulk folder: the folder with the most items.
bulk() { /usr/bin/python3 -c "
import json,sys; m=json.load(open(sys.argv[1]))
f=max(m['folders'], key=lambda f: f['item_count']); print('%x %s' % (f['id'], f['content_table']))" "$1"; }
read -r ref table < <(bulk "$WORK/big.json")

cat "$BIG" > /dev/null
rss() { /usr/bin/time -v "$TARNWELL" scan "$1" --mode advance > /dev/null 2> "$WORK/time.txt"; awk -F': ' '/Maximum resident set size/{print $2}' "$WORK/time.txt"; }
rss_small=$(rss "$SMALL")
rss_big=$(rss "$BIG")
per_message=$(echo "scale=1; ($rss_big - $rss_small) * 1024 / ($big_msgs - $small_msgs)" | bc -l)

now() { date +%s.%N; }
t=$(now); "$TARNWELL" dump "$BIG" "$table" --json > /dev/null; dump_time=$(echo "$(now) - $t" | bc -l)
"$ITEMS" "$BIG" "$ref" > "$WORK/items.txt"
list_time=$(awk -F'\t' '$1=="list"{print $2}' "$WORK/items.txt")
show_time=$(awk -F'\t' '$1=="show"{print $2}' "$WORK/items.txt")

echo "messages: $big_msgs (big), $small_msgs (small); bulk folder $ref = table $table"
echo "Advance scan peak memory: ${rss_small} KiB (small) ${rss_big} KiB (big): ${per_message} bytes per message beyond the base (goal <= 16)"
echo "dump of $table: ${dump_time}s"
echo "list of the folder: ${list_time}s  ratio to dump: $(echo "scale=2; $list_time / $dump_time" | bc -l)  (goal <= 1.5)"
echo "show of every item: ${show_time}s  ratio to dump: $(echo "scale=2; $show_time / $dump_time" | bc -l)  (goal <= 3)"
