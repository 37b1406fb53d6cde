#!/bin/sh
# SPDX-License-Identifier: MIT
# The example model files are exactly what the generator makes.
#   example_models_reproducible.sh GENERATOR SOURCE_DIR
set -eu
out=$(mktemp -d)
trap 'rm -rf "$out"' EXIT
"$1" "$out" >/dev/null
for f in $(cd "$out" && find . -name '*.rcmodel' | sort); do
  cmp "$out/$f" "$2/examples/$f" || { echo "examples/$f differs from the generator's output"; exit 1; }
done
echo "$(cd "$out" && find . -name '*.rcmodel' | wc -l) example models match the generator"
