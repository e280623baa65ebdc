#!/usr/bin/env bash
# Installs the Debian packages of the open programs that only the quality
# comparisons run beside ours: Blender, whose compositor has a keying node
# (scripts/key-quality.sh), and OpenCV's Python module, whose pyramidal
# Lucas-Kanade tracker runs beside the pattern matcher (bench/TrackBench.cpp),
# and Cairo's Python module, which draws the long path beside the shape
# renderer (bench/ShapeBench.cpp).
# Not needed to build, test or render; safe to run again.
set -euo pipefail
exec "$(dirname "$0")/setup-deps.sh" blender python3-opencv python3-cairo
