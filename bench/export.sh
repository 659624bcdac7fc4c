#!/usr/bin/env bash
# Export benchmark: a generated legacy database of about 1 GiB (200,000
# messages) exported to EML, against `tarnwell dump` of its message and
# attachment tables in the same run.
#
#   bench/export.sh [BUILD_DIR] [WORK_DIR]
set -euo pipefail
BUILD=${1:-build}
WORK=${2:-$(mktemp -d /tmp/tarnwell-export-bench.XXXXXX)}
FORGE=$BUILD/testing/exchange/tarnwell-forge-exchange
TARNWELL=$BUILD/cli/tarnwell
BIG=$WORK/big.edb
mkdir -p "$WORK"
[ -f "$BIG" ] || "$FORGE" "$BIG" --version 2 --messages 200000 --large-folder 10000 --size-mib 1024 --seed 3 --manifest "$WORK/big.json" >/dev/null
cat "$BIG" > /dev/null

now() { date +%s.%N; }
t=$(now)
"$TARNWELL" dump "$BIG" Msg --json > /dev/null
"$TARNWELL" dump "$BIG" 1-24 --json > /dev/null
dump_time=$(echo "$(now) - $t" | bc -l)

rm -rf "$WORK/out" "$WORK/logs"; mkdir -p "$WORK/out" "$WORK/logs"
t=$(now)
"$TARNWELL" export "$BIG" --to eml --out "$WORK/out" --log-dir "$WORK/logs" > "$WORK/export.txt" 2>/dev/null
export_time=$(echo "$(now) - $t" | bc -l)
items=$(find "$WORK/out" -name '*.eml' | wc -l)

echo "dump of Msg and 1-24: ${dump_time}s"
echo "export to EML: ${export_time}s, $items items, $(echo "scale=0; $items / $export_time" | bc -l) items/s"
echo "ratio to dump: $(echo "scale=2; $export_time / $dump_time" | bc -l)  (goal <= 3)"
rm -rf "$WORK/out"
