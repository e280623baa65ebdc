#!/usr/bin/env bash
# The cost of rendering through Slurm: a 24-frame flow (1920 x 1080, a turn and a
# blur, PNG files) rendered locally, then submitted in 4 chunks to a one-node
# cluster of its own (scripts/slurm-cluster.sh), timed from `orvane submit` to
# the last task leaving the queue. The node runs as many tasks at once as it has
# CPUs, so the same 4 chunks are also run locally that many at a time: the
# difference between those two is the submission, scheduling and task start-up.
#   bench/farm-overhead.sh [BUILD_DIR]   (default build/; needs slurm-wlm and munge)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
orvane="$(cd "${1:-$root/build}" && pwd)/bin/orvane"
work=$(mktemp -d /tmp/orvane-farm-bench.XXXXXX)
trap '"$root/scripts/slurm-cluster.sh" stop "$work/cluster" >/dev/null 2>&1 || true; rm -rf "$work"' EXIT
eval "$("$root/scripts/slurm-cluster.sh" start "$work/cluster")"

flow() {
  cat <<DOC
Orvane.Document { Version = 1, RenderRange = { 1, 24 }, Tools = {
  Bg = Background { Inputs = { Type = "Gradient", Width = 1920, Height = 1080 } },
  Turn = Transform { Inputs = { Angle = Curve { { 1, 0 }, { 24, 23 } }, Input = Bg.Output } },
  Soft = Blur { Inputs = { XBlurSize = 20, Input = Turn.Output } },
  Out = Saver { Inputs = { Clip = "$1/f.####.png", CreateDir = 1, Input = Soft.Output } },
} }
DOC
}
flow "$work/local" >"$work/local.flow"
flow "$work/chunks" >"$work/chunks.flow"
flow "$work/farm" >"$work/farm.flow"
now() { date +%s.%N; }
seconds() { awk -v a="$1" -v b="$2" 'BEGIN { printf "%.2f", b - a }'; }

start=$(now)
"$orvane" render "$work/local.flow" >/dev/null
local_s=$(seconds "$start" "$(now)")

start=$(now)
seq 1 4 | xargs -P "$(nproc)" -I{} "$orvane" render "$work/chunks.flow" --chunk {}/4 >/dev/null
chunks_s=$(seconds "$start" "$(now)")

start=$(now)
id=$("$orvane" submit "$work/farm.flow" --chunks 4 | sed -n 's/^submitted job \([0-9]*\):.*/\1/p')
while [ -n "$(squeue -h -r -j "$id" -o %i 2>/dev/null)" ]; do sleep 0.05; done
farm_s=$(seconds "$start" "$(now)")

same=yes
for f in "$work"/local/*.png; do
  cmp -s "$f" "$work/farm/$(basename "$f")" && cmp -s "$f" "$work/chunks/$(basename "$f")" || same=no
done
echo "24 frames of 1920 x 1080 on $(nproc) CPUs"
echo "local render, one process:               $local_s s"
echo "local, 4 chunks $(nproc) at a time:             $chunks_s s"
echo "Slurm, 4 chunks (submit to last done):   $farm_s s"
echo "overhead of Slurm over the local chunks: $(seconds "$chunks_s" "$farm_s") s"
echo "files identical: $same"
