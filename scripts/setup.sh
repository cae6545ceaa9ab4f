#!/usr/bin/env bash
# Installs the Debian packages the build, the tests, the benchmarks, the fuzz targets, the lint
# (scripts/lint.sh) and the Debian packages' making and checking need, and playwright-core for the browser tests (npm ci, at
# the version package-lock.json pins).
# Does nothing when all of them are present, so it is cheap to run before every build.
set -euo pipefail

packages=(
    cmake ninja-build g++ pkg-config time
    qt6-base-dev libqt6sql6-sqlite qt6-httpserver-dev qt6-websockets-dev libutf8proc-dev
    libbenchmark-dev
    clang libclang-rt-dev clang-format clang-tidy
    help2man dpkg-dev lintian
    chromium
)
# Node.js runs the browser tests: Debian's, unless a node is already installed.
command -v node >/dev/null || packages+=(nodejs npm)

missing=()
for p in "${packages[@]}"; do
    if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed'; then
        missing+=("$p")
    fi
done
if [ ${#missing[@]} -gt 0 ]; then
    sudo=""
    [ "$(id -u)" -ne 0 ] && sudo="sudo"
    echo "Installing: ${missing[*]}" >&2
    $sudo apt-get update -qq
    DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends \
        "${missing[@]}" >&2
fi

cd "$(dirname "$0")/.."
pinned() { node -p "require('./package-lock.json').packages['node_modules/playwright-core'].version"; }
installed() { node -p "require('./node_modules/playwright-core/package.json').version" 2>/dev/null; }
if [ "$(installed || true)" != "$(pinned)" ]; then
    npm ci --no-audit --no-fund >&2
fi
