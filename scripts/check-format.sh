#!/usr/bin/env bash
# Checks that every tracked C++ file (.h, .cpp) is formatted as the repository's .clang-format
# says. Changes nothing; lists the files that differ and exits non-zero when there is any.
# Fix a file with `clang-format -i FILE`. Usage: scripts/check-format.sh
set -euo pipefail
cd "$(dirname "$0")/.."
scripts/ensure-deps.sh

unformatted=()
while IFS= read -r -d '' file; do
  # --dry-run -Werror: a file that clang-format would change makes it fail; its diagnostics
  # (every line it would change) are not wanted here, only the file's name.
  clang-format --style=file --dry-run -Werror "$file" >/dev/null 2>&1 || unformatted+=("$file")
done < <(git ls-files -z -- '*.h' '*.cpp')

if [ ${#unformatted[@]} -gt 0 ]; then
  echo "Not formatted with .clang-format (fix with clang-format -i):" >&2
  printf '  %s\n' "${unformatted[@]}" >&2
  exit 1
fi
echo "All $(git ls-files -- '*.h' '*.cpp' | wc -l) C++ files are formatted."
