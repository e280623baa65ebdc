#!/usr/bin/env bash
# Runs the farm tests alone: builds what they need in build/ and runs them on a
# one-node Slurm cluster that ctest starts (scripts/slurm-cluster.sh) in
# build/farm-cluster and stops after them. scripts/test.sh runs them with the rest.
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/setup-deps.sh
jobs="${ORVANE_JOBS:-2}"
cmake --preset release
cmake --build --preset release -j "$jobs" --target orvane test_apps_farm
ctest --preset release -L farm --output-on-failure
