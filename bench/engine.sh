#!/usr/bin/env bash
# Engine benchmark: catalog stages and table dump on generated databases,
# reported as ratios against baselines measured in the same run.
#
#   bench/engine.sh [BUILD_DIR] [WORK_DIR]
#
# Needs about 1.2 GiB of disk in WORK_DIR (default: a fresh temporary folder).
set -euo pipefail
BUILD=${1:-build}
WORK=${2:-$(mktemp -d /tmp/tarnwell-bench.XXXXXX)}
FORGE=$BUILD/testing/tarnwell-forge
STAGES=$BUILD/bench/tarnwell-bench-stages
TARNWELL=$BUILD/cli/tarnwell
BIG=$WORK/big.edb
SMALL=$WORK/small.edb
mkdir -p "$WORK"

[ -f "$BIG" ] || "$FORGE" big "$BIG" --size-mib 1024 --page-size 32768 --revision 20 --seed 7 >/dev/null
[ -f "$SMALL" ] || "$FORGE" big "$SMALL" --size-mib 64 --page-size 32768 --revision 20 --seed 7 >/dev/null

now() { date +%s.%N; }
elapsed() { echo "$(now) - $1" | bc -l; }
ratio() { echo "scale=2; $1 / $2" | bc -l; }

# Baseline: reading the whole file once, from the page cache.
cat "$BIG" > /dev/null
t=$(now); cat "$BIG" > /dev/null; cat_time=$(elapsed "$t")

# Advance-mode catalog stages, with peak memory.
/usr/bin/time -v "$STAGES" "$BIG" advance > "$WORK/advance.txt" 2> "$WORK/advance.time"
advance_time=$(awk -F'\t' '$1=="total"{print $2}' "$WORK/advance.txt")
advance_rss=$(awk -F': ' '/Maximum resident set size/{print $2}' "$WORK/advance.time")

# Standard-mode catalog stages on 64 MiB and 1 GiB.
"$STAGES" "$SMALL" standard > "$WORK/std_small.txt"
"$STAGES" "$BIG" standard > "$WORK/std_big.txt"
std_small=$(awk -F'\t' '$1=="total"{print $2}' "$WORK/std_small.txt")
std_big=$(awk -F'\t' '$1=="total"{print $2}' "$WORK/std_big.txt")

# Dump of the largest table against esedbexport of the same database.
TABLE=Messages
t=$(now); "$TARNWELL" dump "$BIG" "$TABLE" --json > /dev/null; dump_time=$(elapsed "$t")
rm -rf "$WORK/export" "$WORK/export.export"
if command -v esedbexport > /dev/null; then
  t=$(now); esedbexport -t "$WORK/export" -T "$TABLE" "$BIG" > /dev/null 2>&1 || true
  export_time=$(elapsed "$t")
else
  export_time=""
fi

echo "cat of 1 GiB:                   ${cat_time}s"
echo "Advance catalog stages:         ${advance_time}s  ratio to cat: $(ratio "$advance_time" "$cat_time")  (goal <= 2)"
echo "Advance peak resident memory:   $((advance_rss / 1024)) MiB  (goal < 256)"
echo "Standard stages 64 MiB / 1 GiB: ${std_small}s / ${std_big}s  ratio: $(ratio "$std_big" "$std_small")  (goal about 1)"
if [ -n "$export_time" ]; then
  echo "dump $TABLE / esedbexport:    ${dump_time}s / ${export_time}s  speed-up: $(ratio "$export_time" "$dump_time")  (goal >= 10)"
fi
