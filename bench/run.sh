#!/usr/bin/env bash
# Builds the release daemon and its benchmark, then measures a simulated phone:
#   bench/run.sh [--rounds N] [--idle-seconds S]
set -euo pipefail
cd "$(dirname "$0")/.."
cmake --preset release >/dev/null
cmake --build --preset release --target ftcmd_bench >/dev/null
exec build/release/bench/ftcmd_bench "$@"
