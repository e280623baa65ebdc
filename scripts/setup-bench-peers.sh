#!/usr/bin/env bash
# Installs the Debian packages of the open programs that only the keying
# quality comparison runs beside ours (scripts/key-quality.sh): Blender, whose
# compositor has a keying node. Not needed to build, test or render; safe to
# run again.
set -euo pipefail
packages=(blender)
missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ ${#missing[@]} -eq 0 ]; then
  echo "setup-bench-peers: all packages present"
  exit 0
fi
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
export DEBIAN_FRONTEND=noninteractive
$SUDO apt-get update
$SUDO apt-get install -y --no-install-recommends "${missing[@]}"
