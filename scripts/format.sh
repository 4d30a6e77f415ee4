#!/usr/bin/env bash
# Formats every C++ file the repository tracks with .clang-format.
#   bash scripts/format.sh           rewrites the files in place
#   bash scripts/format.sh --check   changes nothing; lists the files it would
#                                    change and fails when there are any (CI)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
cd "$top"
mode=${1:-fix}
[[ "$mode" == fix || "$mode" == --check ]] || { echo "format: unknown argument '$mode' (--check or nothing)" >&2; exit 2; }
formatter=$(command -v clang-format-14 || command -v clang-format || true)
[[ -n "$formatter" ]] || { echo "format: clang-format is missing (Debian: apt-get install clang-format)" >&2; exit 2; }

mapfile -d '' files < <(git ls-files -z -- '*.cpp' '*.h')
if [[ "$mode" == fix ]]; then
  printf '%s\0' "${files[@]}" | xargs -0 -n 50 -P 2 "$formatter" -i
  exit 0
fi
unformatted=()
for file in "${files[@]}"; do
  "$formatter" --dry-run --Werror "$file" 2>/dev/null || unformatted+=("$file")
done
if ((${#unformatted[@]})); then
  echo "format: ${#unformatted[@]} files differ from .clang-format (run bash scripts/format.sh):" >&2
  printf '  %s\n' "${unformatted[@]}" >&2
  exit 1
fi
echo "format: ${#files[@]} files match .clang-format"
