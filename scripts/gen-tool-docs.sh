#!/usr/bin/env bash
# Writes the tool reference in docs/tools/ from the registry: one page per
# built tool (orvane describe CLASS --markdown; formats and data types have
# none) and an index. A test compares the pages with the program, so run this
# after changing a tool's controls.
#   scripts/gen-tool-docs.sh [path/to/orvane]
set -euo pipefail
cd "$(dirname "$0")/.."
orvane="${1:-build/bin/orvane}"
out=docs/tools
rm -f "$out"/*.md
mapfile -t rows < <("$orvane" tools | awk 'NR > 1 && $NF == "yes" && $3 != "format" && $3 != "data" { print $1 }')
{
  echo "# Tool reference"
  echo
  echo "One page per built tool, written from the class registry by"
  echo "\`scripts/gen-tool-docs.sh\` (\`orvane describe CLASS --markdown\`), so the pages"
  echo "say exactly what the program does. The user guide (../USER_GUIDE.md) says how"
  echo "to write values: numbers, choice names, points, curves and links."
  echo
  echo "| Tool | Class ID | What it does |"
  echo "|---|---|---|"
} > "$out/README.md"
for id in "${rows[@]}"; do
  "$orvane" describe "$id" --markdown > "$out/$id.md"
  title=$(head -1 "$out/$id.md" | sed -e 's/^# //' -e 's/ (`.*`)$//')
  help=$(sed -n '3p' "$out/$id.md")
  echo "| [$title]($id.md) | \`$id\` | $help |" >> "$out/README.md"
done
echo "gen-tool-docs: ${#rows[@]} pages in $out"
