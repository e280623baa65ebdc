#!/usr/bin/env bash
# Builds the libFuzzer harnesses (preset fuzz, in build-fuzz/) and runs each
# for SECONDS; fails when one finds a crash, a leak, a hang, or memory use
# over the limits, and keeps the input under build-fuzz/crashes/.
#   scripts/fuzz.sh                 every harness, 20 s each
#   scripts/fuzz.sh 300 png raw     fuzz_png and fuzz_raw, 5 minutes each
#   build-fuzz/bin/fuzz_png FILE    runs one input again
# Corpora grow in build-fuzz/corpus/<target>/, seeded with files our own
# writers make (fuzz_seeds), the example documents, and the damaged OpenEXR
# files of the shared test data when it is there.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds="${1:-20}"
shift || true
all=(bmp targa raw jpeg ipl png openexr document)
targets=("$@")
[ ${#targets[@]} -gt 0 ] || targets=("${all[@]}")
for t in "${targets[@]}"; do
  [[ " ${all[*]} " == *" $t "* ]] || { echo "fuzz.sh: no harness '$t' (${all[*]})" >&2; exit 2; }
done

out=build-fuzz
cmake --preset fuzz >/dev/null
cmake --build --preset fuzz -j "${ORVANE_JOBS:-2}" --target fuzz_seeds "${targets[@]/#/fuzz_}"
"$out/bin/fuzz_seeds" "$out/seeds"
mkdir -p "$out/seeds/document" "$out/crashes"
cp examples/*.flow "$out/seeds/document/"

# Limits: a reader must refuse a damaged file without a huge allocation.
# The harness skips the pixels of a header over its pixel budget; what is
# left fits well inside these (AddressSanitizer's own use included).
options=(-max_total_time="$seconds" -timeout=20 -rss_limit_mb=2048 -malloc_limit_mb=512 -max_len=65536
  -print_final_stats=1)
failed=()
for t in "${targets[@]}"; do
  corpus="$out/corpus/$t"
  mkdir -p "$corpus"
  seeds=()
  extra=()
  case "$t" in
    document) seeds=("$out/seeds/$t") extra=(-dict="$out/seeds/document.dict") ;;
    openexr)
      seeds=("$out/seeds/$t")
      for d in ../shared/testdata /work/shared/testdata; do
        if [ -d "$d/openexr-images/Damaged" ]; then seeds+=("$d/openexr-images/Damaged"); break; fi
      done ;;
    *) seeds=("$out/seeds/$t") ;;
  esac
  log="$out/fuzz-$t.log"
  echo "fuzz.sh: fuzz_$t for ${seconds} s (log $log)"
  if ! "$out/bin/fuzz_$t" "${options[@]}" "${extra[@]}" -artifact_prefix="$out/crashes/$t-" \
    "$corpus" "${seeds[@]}" >"$log" 2>&1; then
    failed+=("$t")
    tail -n 60 "$log"
  fi
  grep -E "^stat::number_of_executed_units|^Done" "$log" | tr '\n' ' ' || true
  echo
done
if [ ${#failed[@]} -gt 0 ]; then
  echo "fuzz.sh: FAILED: ${failed[*]}; inputs in $out/crashes/" >&2
  exit 1
fi
echo "fuzz.sh: ${#targets[@]} harnesses ran ${seconds} s each without a fault"
