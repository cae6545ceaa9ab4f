#!/usr/bin/env bash
# Checks the tracked C++ sources: their formatting against .clang-format (clang-format 14, as on
# Debian 12; newer versions format some constructs differently) and clang-tidy with .clang-tidy,
# over the compile database of the default build, which must have been configured and built
# (cmake --workflow --preset default) so that the moc files exist. Prints every finding as
# file:line:col: message [check] and fails when there is one.
#
#   scripts/lint.sh [BUILD_DIR]      (default: build/default)
set -euo pipefail
cd "$(dirname "$0")/.."
root=$PWD
build=${1:-build/default}

status=0

echo "== clang-format" >&2
mapfile -t sources < <(git ls-files '*.cpp' '*.h')
if ! clang-format --dry-run -Werror "${sources[@]}"; then
    echo "clang-format: run clang-format -i on the files above" >&2
    status=1
fi

echo "== clang-tidy" >&2
database=$build/compile_commands.json
if [ ! -f "$database" ]; then
    echo "$database is missing: run cmake --workflow --preset default first" >&2
    exit 1
fi
# Every tracked translation unit must be in the database, so that none goes unchecked.
mapfile -t units < <(git ls-files '*.cpp')
missing=()
for unit in "${units[@]}"; do
    grep -qF "\"file\": \"$root/$unit\"" "$database" || missing+=("$unit")
done
if [ ${#missing[@]} -gt 0 ]; then
    printf '%s: not in %s\n' "${missing[@]}" "$database" >&2
    exit 1
fi

# One clang-tidy per unit, on every core; findings in headers repeat once per includer, so the
# sorted, de-duplicated diagnostic lines are what is reported.
log=$(mktemp)
errors=$(mktemp)
trap 'rm -f "$log" "$errors"' EXIT
if ! printf '%s\n' "${units[@]}" |
    xargs -P "$(nproc)" -n 1 clang-tidy -p "$build" --quiet >"$log" 2>"$errors"; then
    tidyFailed=1
fi
findings=$(grep -E '^/.*: (warning|error): ' "$log" | sed "s|^$root/||" | sort -u || true)
if [ -n "$findings" ]; then
    echo "$findings"
    echo "clang-tidy: $(echo "$findings" | wc -l) findings" >&2
    status=1
elif [ -n "${tidyFailed:-}" ]; then
    cat "$log" "$errors" >&2
    status=1
else
    echo "clang-tidy: no findings in ${#units[@]} translation units" >&2
fi
exit $status
