#!/usr/bin/env bash
# Builds the libFuzzer harnesses (preset fuzz, in build-fuzz/) and runs each
# for SECONDS; fails when one finds a crash, a leak, a hang, or memory use
# over the limits, and keeps the input under build-fuzz/crashes/.
#   scripts/fuzz.sh                 every harness, 20 s each
#   scripts/fuzz.sh 300 png raw     fuzz_png and fuzz_raw, 5 minutes each
#   build-fuzz/bin/fuzz_png FILE    runs one input again
# Corpora grow in build-fuzz/corpus/<target>/, starting from seeds made at
# run time: files of our own writers (fuzz_seeds), kinds of file only other
# programs write (ImageMagick), the example documents, and the damaged
# OpenEXR files of the shared test data when it is there.
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
seeds="$out/seeds"
cmake --preset fuzz >/dev/null
cmake --build --preset fuzz -j "${ORVANE_JOBS:-2}" --target fuzz_seeds "${targets[@]/#/fuzz_}"
"$out/bin/fuzz_seeds" "$seeds"
mkdir -p "$seeds/document" "$out/crashes"
cp examples/*.flow "$seeds/document/"

# seed TARGET [FORMAT:]FILE CONVERT-ARGS...: a small file made by
# ImageMagick, with the harness's control byte after it.
seed() {
  local target=$1 file=${2#*:} format=
  [[ $2 != *:* ]] || format=${2%%:*}:
  shift 2
  if convert -seed 1 -size 16x12 "$@" "$format$seeds/$target/$file" 2>/dev/null; then
    printf '\0' >>"$seeds/$target/$file"
  else
    echo "fuzz.sh: ImageMagick made no $target/$file"
  fi
}
if command -v convert >/dev/null; then
  seed bmp BMP3:palette.bmp xc: -fx 'rand()' -colors 200 -type Palette -compress None
  seed bmp BMP2:os2.bmp gradient:red-blue
  seed targa palette.tga gradient:red-blue -type Palette -compress RLE
  seed targa grey.tga gradient: -type Grayscale
  seed jpeg progressive.jpg gradient:red-blue -interlace JPEG
  seed jpeg grey.jpg gradient: -type Grayscale
  seed ipl JPEG:cmyk.ipl gradient:red-blue -colorspace CMYK
  seed png PNG8:palette.png gradient:red-blue
  seed png grey16.png gradient: -depth 16 -type Grayscale
  seed png interlaced.png gradient:red-blue -interlace PNG
  seed png transparent.png gradient:red-blue -transparent red
fi

# Limits: a reader must refuse a damaged file without a huge allocation.
# The harness skips the pixels of a header over its pixel budget; what is
# left fits well inside these (AddressSanitizer's own use included).
options=(-max_total_time="$seconds" -timeout=20 -rss_limit_mb=2048 -malloc_limit_mb=512 -max_len=65536
  -print_final_stats=1)
failed=()
for t in "${targets[@]}"; do
  corpus="$out/corpus/$t"
  mkdir -p "$corpus"
  dirs=("$corpus" "$seeds/$t")
  extra=()
  [ "$t" != document ] || extra=(-dict="$seeds/document.dict")
  for d in ../shared/testdata /work/shared/testdata; do
    if [ "$t" = openexr ] && [ -d "$d/openexr-images/Damaged" ]; then
      dirs+=("$d/openexr-images/Damaged")
      break
    fi
  done
  log="$out/fuzz-$t.log"
  echo "fuzz.sh: fuzz_$t for ${seconds} s (log $log)"
  if ! "$out/bin/fuzz_$t" "${options[@]}" "${extra[@]}" -artifact_prefix="$out/crashes/$t-" "${dirs[@]}" \
    >"$log" 2>&1; then
    failed+=("$t")
    tail -n 60 "$log"
  fi
  grep -E "^#[0-9]+[[:space:]]+DONE" "$log" || true
done
if [ ${#failed[@]} -gt 0 ]; then
  echo "fuzz.sh: FAILED: ${failed[*]}; inputs in $out/crashes/" >&2
  exit 1
fi
echo "fuzz.sh: ${#targets[@]} harnesses ran ${seconds} s each without a fault"
