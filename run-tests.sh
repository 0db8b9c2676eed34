#!/usr/bin/env bash
# Builds ftcmd and runs every test, in the debug build and in the sanitizer build.
set -euo pipefail
cd "$(dirname "$0")"
scripts/install-deps.sh
for preset in debug asan; do
  echo "== $preset build"
  cmake --preset "$preset" >/dev/null
  cmake --build --preset "$preset"
  echo "== $preset tests"
  ctest --preset "$preset" -j2
done
