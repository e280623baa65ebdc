#!/usr/bin/env bash
# Builds Orvane and runs every test, from a fresh Debian 12 machine:
# installs the packages, checks formatting, configures, builds, runs ctest;
# after the release suite, the test sources are compiled with Clang one by one
# (scripts/check-clang-tests.sh) and each fuzz harness runs briefly
# (scripts/fuzz.sh).
#   scripts/test.sh            release build in build/, then the fuzzers in build-fuzz/
#   scripts/test.sh asan       AddressSanitizer + UBSan build in build-asan/
#   scripts/test.sh clang      release build with Clang in build-clang/
# ORVANE_FUZZ_SECONDS sets the seconds each harness runs (default 10; 0 skips them).
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
[ "$preset" != release ] || scripts/check-clang-tests.sh
if [ "$preset" = release ] && [ "${ORVANE_FUZZ_SECONDS:-10}" != 0 ]; then
  scripts/fuzz.sh "${ORVANE_FUZZ_SECONDS:-10}"
fi
