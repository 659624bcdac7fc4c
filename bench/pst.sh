#!/usr/bin/env bash
# PST benchmark, in one run on one machine:
#  1. a generated legacy database of about 1 GiB exported to one PST,
#     against its export to EML (goal: at most 2x), with MB/s and items/s;
#  2. with --big, a database of about 4.5 GiB exported to one PST of more
#     than 4 GiB, read back by pffinfo, pffexport and readpst. Its items are
#     few and large (40,000, about 115 KB each): pff-tools' index building
#     grows with the square of a folder's item count, so 400,000 small items
#     would keep the readers busy for an hour.
#
#   bench/pst.sh [BUILD_DIR] [WORK_DIR] [--big]
set -euo pipefail
BUILD=${1:-build}
WORK=${2:-$(mktemp -d /tmp/tarnwell-pst-bench.XXXXXX)}
BIGRUN=${3:-}
FORGE=$BUILD/testing/exchange/tarnwell-forge-exchange
TARNWELL=$BUILD/cli/tarnwell
DB=$WORK/big.edb
mkdir -p "$WORK"
[ -f "$DB" ] || "$FORGE" "$DB" --version 2 --messages 200000 --large-folder 10000 --size-mib 1024 --seed 3 --manifest "$WORK/big.json" >/dev/null
cat "$DB" > /dev/null

now() { date +%s.%N; }
rm -rf "$WORK/eml" "$WORK/pst" "$WORK/logs"; mkdir -p "$WORK/eml" "$WORK/pst" "$WORK/logs"
t=$(now)
"$TARNWELL" export "$DB" --to eml --out "$WORK/eml" --log-dir "$WORK/logs" > /dev/null 2>&1
eml_time=$(echo "$(now) - $t" | bc -l)
rm -rf "$WORK/eml"

/usr/bin/time -v -o "$WORK/pst.time" "$TARNWELL" export "$DB" --to pst --out "$WORK/pst" --log-dir "$WORK/logs" > "$WORK/pst.txt" 2>/dev/null
pst_time=$(grep 'Elapsed (wall' "$WORK/pst.time" | awk '{print $NF}' | awk -F: '{ if (NF==3) print $1*3600+$2*60+$3; else print $1*60+$2 }')
pst_rss=$(grep 'Maximum resident' "$WORK/pst.time" | awk '{print $NF}')
items=$(sed -n 's/^Exported \([0-9]*\) of.*/\1/p' "$WORK/pst.txt")
pst_file=$(sed -n 's/^PST: //p' "$WORK/pst.txt" | head -1)
pst_mib=$(( $(stat -c %s "$pst_file") / 1048576 ))
db_mib=$(( $(stat -c %s "$DB") / 1048576 ))

echo "export to EML: ${eml_time}s"
echo "export to PST: ${pst_time}s, $items items, $(echo "scale=0; $items / $pst_time" | bc -l) items/s,"\
     "$(echo "scale=1; $db_mib / $pst_time" | bc -l) MB/s of database, PST ${pst_mib} MiB, peak RSS ${pst_rss} KiB"
echo "ratio PST / EML: $(echo "scale=2; $pst_time / $eml_time" | bc -l)  (goal <= 2)"
rm -rf "$WORK/pst"

if [ "$BIGRUN" = "--big" ]; then
  HUGE=$WORK/huge.edb
  [ -f "$HUGE" ] || "$FORGE" "$HUGE" --version 2 --messages 40000 --large-folder 4000 --size-mib 5200 --seed 5 --manifest "$WORK/huge.json" >/dev/null
  mkdir -p "$WORK/hugepst"
  t=$(now)
  "$TARNWELL" export "$HUGE" --to pst --out "$WORK/hugepst" --log-dir "$WORK/logs" > "$WORK/huge.txt" 2>/dev/null
  echo "export of $(( $(stat -c %s "$HUGE") / 1048576 )) MiB to PST: $(echo "$(now) - $t" | bc -l)s"
  huge_pst=$(sed -n 's/^PST: //p' "$WORK/huge.txt" | head -1)
  echo "PST size: $(stat -c %s "$huge_pst") bytes"
  pffinfo "$huge_pst" > "$WORK/huge.pffinfo" 2>&1 && echo "pffinfo: ok" || echo "pffinfo: FAILED"
  pffexport -q -m all -f all -t "$WORK/huge.pff" "$huge_pst" > /dev/null 2>&1 && echo "pffexport: ok, $(find "$WORK/huge.pff.export" -name 'Message?????' | wc -l) messages" || echo "pffexport: FAILED"
  mkdir -p "$WORK/huge.readpst"
  readpst -q -j 0 -e -o "$WORK/huge.readpst" "$huge_pst" > /dev/null 2>&1 && echo "readpst: ok, $(find "$WORK/huge.readpst" -name '*.eml' | wc -l) messages" || echo "readpst: FAILED"
  echo "items in the database export: $(sed -n 's/^Exported \([0-9]*\) of.*/\1/p' "$WORK/huge.txt")"
fi
