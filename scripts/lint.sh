#!/usr/bin/env bash
# Static analysis of the sources: clang-tidy with the checks of .clang-tidy
# (which says why each family is on or off) and cppcheck. Both must report
# nothing. Uses its own clang tree, build-lint/, for the compile commands.
set -euo pipefail
cd "$(dirname "$0")/.."
root=$PWD

# Every folder whose sources are analysed; one not there yet is skipped.
source_dirs=(cu tr acl tool)

dirs=()
for d in "${source_dirs[@]}"; do
  [ -d "$d" ] && dirs+=("$d")
done

CC=clang CXX=clang++ cmake -S . -B build-lint -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DBUILD_TESTING=OFF -DCMAKE_COMPILE_WARNING_AS_ERROR=ON -DCMAKE_EXPORT_COMPILE_COMMANDS=ON >/dev/null
# Generated sources, if any, must exist before they are analysed.
cmake --build build-lint -j"$(nproc)" >/dev/null

pattern="$root/($(IFS='|'; echo "${dirs[*]}"))/"
echo "clang-tidy: ${dirs[*]}"
run-clang-tidy-14 -p build-lint -quiet "$pattern" >build-lint/clang-tidy.log 2>&1 || {
  grep -E 'warning:|error:' build-lint/clang-tidy.log || cat build-lint/clang-tidy.log
  echo "clang-tidy found problems (build-lint/clang-tidy.log)" >&2
  exit 1
}

# cppcheck: warnings, performance and portability; missing system headers
# are not findings (cppcheck reads only the project's own). Its style class
# is left out: in cppcheck 2.10 it is mostly preferences (an algorithm for
# every loop), and it takes members read through a table or a returned
# reference for unused.
echo "cppcheck: ${dirs[*]}"
filters=()
for d in "${dirs[@]}"; do
  filters+=("--file-filter=$d/*")
done
cppcheck --project=build-lint/compile_commands.json "${filters[@]}" \
  --enable=warning,performance,portability --inline-suppr \
  --suppress=missingIncludeSystem --error-exitcode=1 -q -j"$(nproc)"
echo "lint: clean"
