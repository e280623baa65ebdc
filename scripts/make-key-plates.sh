#!/usr/bin/env bash
# Writes the synthetic keying plates (docs/KEY_PLATES.md) as OpenEXR files.
#   scripts/make-key-plates.sh FOLDER [WIDTH HEIGHT [SEED]]    default 1920 1080 1
# Builds orvane_key_plates in build/ (the release preset) when needed.
set -euo pipefail
if [ $# -lt 1 ]; then
  echo "usage: scripts/make-key-plates.sh FOLDER [WIDTH HEIGHT [SEED]]" >&2
  exit 2
fi
root="$(cd "$(dirname "$0")/.." && pwd)"
[ -d "$root/build" ] || (cd "$root" && cmake --preset release)
cmake --build "$root/build" --target orvane_key_plates
mkdir -p "$1"
"$root/build/bin/orvane_key_plates" "$@"
