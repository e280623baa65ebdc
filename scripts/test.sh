#!/usr/bin/env bash
# Builds Orvane and runs every test, from a fresh Debian 12 machine:
# installs the packages, checks formatting, configures, builds, runs ctest.
#   scripts/test.sh            release build in build/
#   scripts/test.sh asan       AddressSanitizer + UBSan build in build-asan/
set -euo pipefail
cd "$(dirname "$0")/.."
preset="${1:-release}"

scripts/setup-deps.sh
scripts/check-format.sh

jobs="${ORVANE_JOBS:-2}"
cmake --preset "$preset"
cmake --build --preset "$preset" -j "$jobs"
# The device tests run on OpenCL; setup-deps installs PoCL, so a missing
# device is a failure here rather than a skip.
ORVANE_REQUIRE_DEVICE=opencl ctest --preset "$preset" -j "$jobs"
