#!/usr/bin/env bash
# The keying quality table: every synthetic plate (docs/KEY_PLATES.md) keyed by
# our Delta and Ultra Keyers and, when it is installed
# (scripts/setup-bench-peers.sh), by the keying node of Blender's compositor,
# each given the plate's screen colour, once with its defaults and once with
# the matte clipped to 0.1..0.9 (Low/High Threshold; the node's clip black and
# white). Prints per plate and keyer the mean and largest |alpha - true alpha|
# and the wall time of the whole program (reading, keying, writing). Output
# names hold no digits before their extension: a Saver would number them.
#   scripts/key-quality.sh [FOLDER [WIDTH HEIGHT]]    default a temporary folder, 960 540
set -euo pipefail
root="$(cd "$(dirname "$0")/.." && pwd)"
dir="${1:-$(mktemp -d)}"
width="${2:-960}"
height="${3:-540}"
[ -d "$root/build" ] || (cd "$root" && cmake --preset release >/dev/null)
cmake --build "$root/build" --target orvane orvaneoperators orvane_key_plates >/dev/null
command -v oiiotool >/dev/null || { echo "key-quality: needs oiiotool (scripts/setup-deps.sh)" >&2; exit 2; }
orvane="$root/build/bin/orvane"
mkdir -p "$dir"
"$root/build/bin/orvane_key_plates" "$dir" "$width" "$height" 1 >"$dir/plates.txt"

# Mean and largest |alpha of $1 - true alpha $2| over the frame.
score() {
  [ -f "$1" ] || { echo "failed -"; return; }
  oiiotool "$1" --ch A "$2" --ch R --absdiff --printstats 2>/dev/null |
    awk '/Stats Avg/ {avg = $3} /Stats Max/ {max = $3} END {printf "%.4f %.4f", avg, max}'
}
seconds() { date +%s.%N; }

# Writes a flow that keys $2 with tool class $3 (settings $5...) into $4.
key_flow() {
  local flow="$1" plate="$2" class="$3" out="$4"
  shift 4
  "$orvane" new "$flow" --force >/dev/null
  "$orvane" add "$flow" Loader Plate "Clip=\"$plate\"" >/dev/null
  "$orvane" add "$flow" "$class" Key "$@" >/dev/null
  "$orvane" connect "$flow" Key.Input=Plate >/dev/null
  "$orvane" add "$flow" Saver Out "Clip=\"$out\"" >/dev/null
  "$orvane" connect "$flow" Out.Input=Key >/dev/null
}

printf '%-18s %-22s %8s %8s %8s\n' plate keyer mean worst seconds
while read -r path screen r g b rest; do
  name="$(basename "${path%:}")"
  r="${r}" g="${g%,}" b="${b%,}"
  plate="$dir/$name.composite.exr" truth="$dir/$name.alpha.exr"
  colour=(BackgroundRed="$r" BackgroundGreen="$g" BackgroundBlue="$b")
  for clip in defaults clipped; do
    for class in DeltaKeyer UltraKeyer; do
      settings=("${colour[@]}")
      if [ "$clip" = clipped ]; then
        if [ "$class" = DeltaKeyer ]; then settings+=(LowThreshold=0.1 HighThreshold=0.9)
        else settings+=(LowMatteThreshold=0.1 High=0.9); fi
      fi
      out="$dir/$name.$class.$clip.exr"
      key_flow "$dir/$name.$class.flow" "$plate" "$class" "$out" "${settings[@]}"
      start=$(seconds)
      "$orvane" render "$dir/$name.$class.flow" --frames 0 >/dev/null
      end=$(seconds)
      printf '%-18s %-22s %8s %8s %8.2f\n' "$name" "$class/$clip" $(score "$out" "$truth") "$(echo "$end - $start" | bc)"
    done
    if command -v blender >/dev/null; then
      out="$dir/$name.blender.$clip.exr"
      low=0 high=1
      [ "$clip" = defaults ] || { low=0.1; high=0.9; }
      start=$(seconds)
      blender -b --factory-startup --python "$root/bench/peers/blender_keying.py" -- \
        "$plate" "$out" "$r" "$g" "$b" "$low" "$high" >/dev/null 2>&1
      end=$(seconds)
      printf '%-18s %-22s %8s %8s %8.2f\n' "$name" "blender/$clip" $(score "$out" "$truth") "$(echo "$end - $start" | bc)"
    fi
  done
done < <(grep ': screen ' "$dir/plates.txt")
