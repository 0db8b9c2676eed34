#!/usr/bin/env bash
# Builds ftcmd and starts a simulated phone in the foreground (Ctrl-C stops it).
# Any arguments go to ftcmd-sim, e.g. ./run-sim.sh --mode at --port 7000
set -euo pipefail
cd "$(dirname "$0")"
scripts/install-deps.sh
cmake --preset release >/dev/null
cmake --build --preset release >/dev/null
exec build/release/ftcmd-sim "$@"
