#!/usr/bin/env bash
# Installs the Debian packages of the open programs that only the keying
# quality comparison runs beside ours (scripts/key-quality.sh): Blender, whose
# compositor has a keying node. Not needed to build, test or render; safe to
# run again.
set -euo pipefail
exec "$(dirname "$0")/setup-deps.sh" blender
