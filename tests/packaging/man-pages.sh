#!/bin/bash
# man-pages.sh SOURCE_DIRECTORY: every program that is installed has a page, and man(1) has nothing to say about any.
cd "$1" || exit 1

for tool in man groff; do
  command -v "$tool" >/dev/null && continue
  echo "skipped: $tool is not installed"
  [[ ${CI:-} == true ]] && exit 1
  exit 77
done

failures=0
fail() { echo "$*" && failures=$((failures + 1)); }

programs=$(sed -n 's/^install(TARGETS \([a-z -]*\)\(DESTINATION.*\)\?)$/\1/p' ./*/CMakeLists.txt)
[[ -n $programs ]] || fail "no program found in the CMake files"
for program in $programs; do
  compgen -G "packaging/man/$program.[18]" >/dev/null || fail "$program has no page"
done

for page in packaging/man/*; do
  grep -q "${page##*/}" packaging/CMakeLists.txt || fail "$page is not installed"
  warnings=$(LC_ALL=C.UTF-8 MANWIDTH=80 man --warnings -E UTF-8 -l -Tutf8 -Z "$page" 2>&1 >/dev/null)
  [[ -z $warnings ]] || fail "$page: $warnings"
done
exit $((failures > 0))
