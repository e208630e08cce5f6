#!/usr/bin/env bash
# The complete example of docs/lab.md runs as written: its scenario is the one
# shipped in docs/example, and its commands succeed, run from the top folder
# with the lab under test in place of build/default's and the pictures in a
# folder of their own.
# Usage: runDocumentedExample.sh SOURCE_DIR LAB
set -euo pipefail
source_dir=${1:?usage: runDocumentedExample.sh SOURCE_DIR LAB}
lab=${2:?usage: runDocumentedExample.sh SOURCE_DIR LAB}
doc="$source_dir/docs/lab.md"
written_lab=../../build/default/morvanek-lab/morvanek-lab
written_pictures=/tmp/morvanek-pictures

# The first json and sh blocks after the heading.
block() {
  awk -v kind="$1" '/^## A complete example/ { on = 1 } on && $0 == "```" kind { inside = 1; next }
                    inside && $0 == "```" { exit } inside { print }' "$doc"
}

if ! diff <(block json) "$source_dir/docs/example/example.json" >&2; then
  echo "the example in docs/lab.md differs from docs/example/example.json" >&2
  exit 1
fi
commands=$(block sh)
if [[ $commands != *"$written_lab"* ]]; then
  echo "the example's commands no longer run $written_lab" >&2
  exit 1
fi

pictures=$(mktemp -d)
trap 'rm -rf "$pictures"' EXIT
commands=${commands//"$written_lab"/"$lab"}
commands=${commands//"$written_pictures"/"$pictures"}
cd "$source_dir"
bash -euo pipefail -c "$commands"

for svg in timeline bench-flash bench-timeline spare-flash spare-timeline; do
  if [ ! -s "$pictures/example/$svg.svg" ]; then
    echo "no picture $svg.svg" >&2
    exit 1
  fi
done
echo "the documented example ran as written"
