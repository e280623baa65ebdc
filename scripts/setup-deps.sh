#!/usr/bin/env bash
# Installs the Debian packages Orvane builds and tests with. Safe to run again.
#   scripts/setup-deps.sh [PACKAGE ...]   the packages named instead of the list below
set -euo pipefail
packages=("$@")
[ $# -gt 0 ] || packages=(
  build-essential cmake ninja-build pkg-config ccache
  libtbb-dev libfmt-dev libgtest-dev libgmock-dev libbenchmark-dev
  libjpeg62-turbo-dev libpng-dev zlib1g-dev libopenexr-dev
  # Colour management: colour spaces and LUT files.
  libopencolorio-dev
  # Masks and shapes: polygon offsetting and stroking, anti-aliased scan conversion.
  libpolyclipping-dev libagg-dev
  # Scripts and expressions: LuaJIT with ffi and jit (the maintained 2.1 branch).
  libluajit2-5.1-dev
  # The device path: OpenCL headers and loader, and PoCL, which runs OpenCL
  # kernels on the CPU so that every machine exercises the device path.
  ocl-icd-opencl-dev opencl-headers pocl-opencl-icd
  clang-format
  # The fuzz harnesses and the clang preset (libFuzzer and the sanitizers come with it).
  clang
  # Tests compare our file formats with these programs.
  netpbm imagemagick openexr libjpeg-turbo-progs
  # Blur, resize and merge results and speeds are compared with these.
  openimageio-tools libvips-tools
  # Lens Distort's pixels are compared with OpenCV's lens map and remap, through its Python module.
  python3-opencv
  # Object mattes from strokes: segmentation, optical flow and the network runner of OpenCV.
  libopencv-dev
  # Farm rendering is tested on a one-node Slurm cluster (scripts/slurm-cluster.sh).
  slurm-wlm munge
)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ ${#missing[@]} -eq 0 ]; then
  echo "setup-deps: all packages present"
  exit 0
fi
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
export DEBIAN_FRONTEND=noninteractive
$SUDO apt-get update
$SUDO apt-get install -y --no-install-recommends "${missing[@]}"
