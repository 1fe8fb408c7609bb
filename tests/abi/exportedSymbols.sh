#!/usr/bin/env bash
# SPDX-License-Identifier: Apache-2.0
# Prints the demangled names that a shared library exports, sorted; with a list as second argument, compares instead.
#
#   tests/abi/exportedSymbols.sh <library> [<list>]
#
# After a wanted change of the interface, keep the new list:
#   tests/abi/exportedSymbols.sh build-dev/src/libveldfirewall.so > tests/abi/exportedSymbols.txt
set -euo pipefail
library=${1:?shared library}
std_string="std::__cxx11::basic_string<char, std::char_traits<char>, std::allocator<char> >"
names=$(nm --dynamic --defined-only --demangle "$library" |
  sed -E -e "s/^[0-9a-f]+ [A-Za-z] //" -e "s/$std_string/std::string/g" | LC_ALL=C sort -u)
if [[ $# -eq 1 ]]; then
  printf '%s\n' "$names"
elif ! diff -u --label "$2" --label "$library" "$2" <(printf '%s\n' "$names"); then
  echo "the exported names differ from the list; names that a program may use must never vanish" >&2
  exit 1
fi
