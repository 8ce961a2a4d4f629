#!/usr/bin/env bash
# Runs one libFuzzer target of a fuzz build on its corpus and prints the
# executions, the rate and the final coverage (cov: edges, ft: features).
# The whole output stays in <build>/<name>.log. Fails on any finding.
#   run-fuzzer.sh <build dir> <name> <stopping flags, e.g. -runs=1000000>
set -uo pipefail
build=$1 name=$2
shift 2
stop=("$@")

# Short inputs for the per-decoder and registry fuzzers (a settings block
# and an audio script); the hotsound one needs a whole default broadcast,
# the older ones whole recordings.
case $name in
  dsss_decoder | dtmf_decoder | decoder_registry) max_len=16384 ;;
  hotsound_decoder) max_len=70000 ;;
  decoder) max_len=120000 ;;
  # A WAV image of the 8000-sample seeds.
  sound_file) max_len=20000 ;;
  # Symbol strings and score maps: longer inputs only cost time.
  *) max_len=4096 ;;
esac

# Inputs that once failed are read with the corpus (new units go to the
# corpus, the first directory).
regressions=$(dirname "$0")/../fuzz/regressions/$name
extra=()
if [ -d "$regressions" ]; then extra=("$regressions"); fi

log=$build/${name}.log
# One process per corpus: no other process adds units to reread.
echo "== ${name}_fuzzer ${stop[*]}"
start=$(date +%s)
"$build/fuzz/${name}_fuzzer" "${stop[@]}" -max_len=$max_len -rss_limit_mb=4096 -reload=0 \
  -print_final_stats=1 "$build/corpus/$name" "${extra[@]}" >"$log" 2>&1
rc=$?
seconds=$(($(date +%s) - start))
grep -E 'ERROR|SUMMARY|Check failed' "$log" | head -5
awk -v s="$seconds" '
  /DONE/ { line = $0 }
  /number_of_executed_units/ { runs = $2 }
  END {
    match(line, /cov: [0-9]+ ft: [0-9]+/)
    printf "   %d runs in %d s (%d/s), %s\n", runs, s, runs / (s > 0 ? s : 1),
           substr(line, RSTART, RLENGTH)
  }' "$log"
exit $rc
