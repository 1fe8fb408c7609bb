#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Installs a build into a fresh folder, moves that folder, and builds and starts the examples against it while the
# source tree is hidden (an empty file system is mounted over it in a private mount namespace).
#
# Leaves programs and installed tree in <build tree>/tests/consumer/<way>, where examplesTest.cpp runs them.
#
#   tests/consumer/buildExamples.sh find_package|pkg_config <source tree> <build tree>
set -euo pipefail
way=${1:?way} source_tree=${2:?source tree}

try_examples() {  # try_examples <folder of blocked, profiles and readme>
  "$1/blocked" --help | grep "usage: blocked"
  "$1/profiles" --help | grep "usage: profiles"
  ldd "$1/readme" | grep -F "libveldcore.so.1 => $PWD/installed"
  local status=0
  "$1/profiles" no-such-verb || status=$?
  [[ $status -eq 2 ]]
}

with_find_package() {
  local example
  for example in c cpp readme; do
    cmake -S "examples/$example" -B "built/$example" -DCMAKE_PREFIX_PATH="$PWD/installed" --log-level=NOTICE
    cmake --build "built/$example"
  done
  mkdir bin
  cp built/c/blocked built/cpp/profiles built/readme/readme bin
  try_examples bin
}

with_pkg_config() {
  local pc flags strict=(-Wall -Wextra -Wpedantic -Werror)
  pc=$(find installed -name veldfirewall.pc)
  PKG_CONFIG_PATH=$PWD/$(dirname "$pc")
  export PKG_CONFIG_PATH
  read -ra flags <<<"$(pkg-config --cflags --libs veldfirewall)"
  mkdir bin
  "${CC:-cc}" -std=c11 "${strict[@]}" -o bin/blocked examples/c/blocked.c "${flags[@]}"
  "${CXX:-c++}" -std=c++17 "${strict[@]}" -o bin/profiles examples/cpp/profiles.cpp "${flags[@]}"
  "${CXX:-c++}" -std=c++17 "${strict[@]}" -o bin/readme examples/readme/readme.cpp "${flags[@]}"
  LD_LIBRARY_PATH=$(pkg-config --variable=libdir veldfirewall)
  export LD_LIBRARY_PATH
  try_examples bin
}

if [[ ${3:-} == hidden ]]; then  # second call, in the namespace, in the work folder
  mount -t tmpfs none "$source_tree"
  [[ ! -e $source_tree/CMakeLists.txt ]]
  "with_$way"
  exit
fi

build_tree=${3:?build tree}
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
# DESTDIR, because the network tool's place is absolute.
DESTDIR=$work/stage cmake --install "$build_tree" --prefix /first >"$work/install.log" ||
  { cat "$work/install.log"; exit 1; }
mv "$work/stage/first" "$work/installed"
cp -r "$source_tree/examples" "${BASH_SOURCE[0]}" "$work"
mkdir "$work/examples/readme"
awk '/^```cpp$/ {inside = 1; next} /^```$/ {if (inside) exit} inside' "$source_tree/README.md" \
  >"$work/examples/readme/readme.cpp"
sed -e 's/veld_profiles/veld_readme/' -e 's/profiles/readme/g' "$source_tree/examples/cpp/CMakeLists.txt" \
  >"$work/examples/readme/CMakeLists.txt"

namespace=(unshare --mount)
[[ $EUID -eq 0 ]] || namespace+=(--user --map-root-user)
cd "$work"
"${namespace[@]}" bash "$work/${BASH_SOURCE[0]##*/}" "$way" "$source_tree" hidden

# The tests that run the programs find them, the installed tree and the shipped data here.
kept=$build_tree/tests/consumer/$way
rm -rf "$kept"
mkdir -p "$kept"
cp -a bin installed stage "$kept"
