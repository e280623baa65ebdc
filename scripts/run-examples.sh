#!/usr/bin/env bash
# The main job on the bundled examples, from a fresh Debian 12 machine:
# installs the packages, builds the program, and evaluates every flow in
# examples/ the way its "-- orvane-eval:" line says, printing what it produces.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup-deps.sh
cmake --preset release >/dev/null
cmake --build --preset release -j "${ORVANE_JOBS:-2}" --target orvane orvaneoperators

status=0
for flow in examples/*.flow; do
  while IFS= read -r line; do
    args="${line#-- orvane-eval:}"
    echo "== orvane eval $flow$args"
    # shellcheck disable=SC2086
    build/bin/orvane eval "$flow" $args || status=$?
    echo
  done < <(grep '^-- orvane-eval:' "$flow")
done
exit $status
