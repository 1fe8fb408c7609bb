#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Runs every fuzz target of a build for some seconds on a copy of its corpus; ends at the first finding.
#
#   scripts/fuzz.sh <build directory> <seconds per target>
#
# Targets are <build>/fuzz/veld_fuzz_NAME, corpora fuzz/corpus/NAME/. What a run adds to the corpus, and the input of a
# finding, is left in out/fuzz/NAME/.
set -euo pipefail
build=${1:?build directory}
seconds=${2:?seconds per target}
source_dir=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)

shopt -s nullglob
targets=("$build"/fuzz/veld_fuzz_*)
if [[ ${#targets[@]} -eq 0 ]]; then
  echo "${0##*/}: no fuzz targets in $build/fuzz" >&2
  exit 1
fi
for target in "${targets[@]}"; do
  name=${target##*/veld_fuzz_}
  work=$source_dir/out/fuzz/$name
  mkdir -p "$work/corpus"
  corpora=("$work/corpus")
  [[ ! -d $source_dir/fuzz/corpus/$name ]] || corpora+=("$source_dir/fuzz/corpus/$name")
  echo "== $name, $seconds s"
  "$target" -max_total_time="$seconds" -artifact_prefix="$work/" -print_final_stats=1 "${corpora[@]}"
done
