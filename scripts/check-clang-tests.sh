#!/usr/bin/env bash
# Checks that every test source compiles with Clang on its own: the release
# build compiles the tests with GCC in unity batches, where one file's
# includes can hide another's missing ones and GCC accepts what Clang does
# not. Syntax only, so it takes seconds; the full Clang build is
# `scripts/test.sh clang`.
set -euo pipefail
cd "$(dirname "$0")/.."
jobs="${ORVANE_JOBS:-2}"
# shellcheck disable=SC2207 # pkg-config's flags are words
flags=(-fsyntax-only -std=c++20 -I. $(pkg-config --cflags luajit OpenEXR) -DORVANE_HAVE_CUDA -DORVANE_HAVE_OPENCL -DGTEST_HAS_PTHREAD=1
       "-DORVANE_SOURCE_DIR=\"$PWD\"" "-DORVANE_BINARY_DIR=\"$PWD/build/bin\"")
failed=$(find tests -name '*.cpp' -not -path 'tests/fuzz/*' | sort |
  xargs -P "$jobs" -I{} sh -c 'clang++ "$@" {} >/dev/null 2>&1 || echo {}' sh "${flags[@]}")
if [ -n "$failed" ]; then
  echo "check-clang-tests: these test files do not compile with Clang on their own:" >&2
  echo "$failed" >&2
  echo "(see: clang++ ${flags[*]} FILE)" >&2
  exit 1
fi
echo "check-clang-tests: $(find tests -name '*.cpp' -not -path 'tests/fuzz/*' | wc -l) test files compile with Clang"
