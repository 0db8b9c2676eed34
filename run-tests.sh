#!/usr/bin/env bash
# Builds ftcmd and runs every test, in the debug build and in the sanitizer build.
set -euo pipefail
cd "$(dirname "$0")"
scripts/install-deps.sh
leftovers() { { ls -d /tmp/ftcmd-test.* /tmp/ftcmd-sim.* 2>/dev/null || true; } | sort; }
before=$(leftovers)
for preset in debug asan; do
  echo "== $preset build"
  cmake --preset "$preset" >/dev/null
  cmake --build --preset "$preset"
  echo "== $preset tests"
  ctest --preset "$preset" -j2
done
# Every simulated phone lives in a temp sandbox that its test removes again.
after=$(leftovers)
if [ "$before" != "$after" ]; then
  echo "tests left sandboxes behind:"; comm -13 <(echo "$before") <(echo "$after")
  exit 1
fi
