#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Checks the form of the tracked files: format of C and C++, shell scripts, licence lines, stray build paths.
# Prints every fault and exits 1 if there was one. (clang-tidy runs in the build: CMake preset "tidy".)
set -euo pipefail
cd "$(dirname "${BASH_SOURCE[0]}")/.."

# As in the work tree, so that a new file counts before it is committed; a deleted one does not.
tracked() {
  git -c safe.directory="$PWD" ls-files --cached --others --exclude-standard -z -- "$@" |
    while IFS= read -r -d '' file; do [[ ! -f $file ]] || printf '%s\0' "$file"; done
}
mapfile -d '' sources < <(tracked '*.c' '*.cpp' '*.h')
mapfile -d '' scripts < <(tracked '*.sh' .ci/run)
mapfile -d '' all < <(tracked .)
faults=0
if [[ ${#sources[@]} -eq 0 || ${#scripts[@]} -eq 0 ]]; then  # no Git, or a tree that it does not trust
  echo "${0##*/}: the tracked files cannot be listed" >&2
  exit 1
fi

clang-format --dry-run -Werror "${sources[@]}" || faults=1
shellcheck "${scripts[@]}" || faults=1

for file in "${sources[@]}" "${scripts[@]}"; do
  if ! head -n 2 "$file" | grep -q 'SPDX-License-Identifier: Apache-2.0'; then
    echo "$file: no licence line"
    faults=1
  fi
done

# A path of the checkout in a tracked file works on one machine only.
if grep -nIP -- "(?<![\\w./-])\\Q$PWD\\E/" "${all[@]}"; then
  echo "the lines above hold this checkout's path"
  faults=1
fi
exit "$faults"
