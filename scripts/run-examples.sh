#!/usr/bin/env bash
# The main job on the bundled examples, from a fresh Debian 12 machine:
# installs the packages, builds the program, renders the flows of examples/
# that have "-- orvane-render:" lines (image sequences in examples/out/) and
# evaluates those with "-- orvane-eval:" lines, printing what they produce.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup-deps.sh
cmake --preset release >/dev/null
cmake --build --preset release -j "${ORVANE_JOBS:-2}" --target orvane orvaneoperators

status=0
for flow in examples/*.flow; do
  # "-- orvane-render: ARGS" renders the flow's Savers to files under examples/out/.
  while IFS= read -r line; do
    args="${line#-- orvane-render:}"
    echo "== orvane render $flow$args"
    # shellcheck disable=SC2086
    build/bin/orvane render "$flow" $args || status=$?
    echo
  done < <(grep '^-- orvane-render:' "$flow")
  while IFS= read -r line; do
    args="${line#-- orvane-eval:}"
    echo "== orvane eval $flow$args"
    # shellcheck disable=SC2086
    build/bin/orvane eval "$flow" $args || status=$?
    echo
  done < <(grep '^-- orvane-eval:' "$flow")
done
exit $status
