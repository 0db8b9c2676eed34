#!/usr/bin/env bash
# Builds ftcmd and runs every test: the debug build, the sanitizer build, a warning-free
# clang build (with its thread-safety analysis), and a short fuzzing run.
set -euo pipefail
cd "$(dirname "$0")"
scripts/install-deps.sh

# This run's sandboxes live under a directory of its own: another run beside it neither
# sees them nor has its own counted as ours.
FTCMD_TEST_TMP=$(mktemp -d "${TMPDIR:-/tmp}/ftcmd-run.XXXXXX")
export FTCMD_TEST_TMP
timings=()
stage() {  # stage NAME COMMAND...: runs the command and notes how long it took
  local name=$1 start=$SECONDS
  shift
  echo "== $name"
  "$@"
  timings+=("$(printf '%-22s %5ds' "$name" $((SECONDS - start)))")
}

for preset in debug asan; do
  stage "$preset build" bash -c "cmake --preset $preset >/dev/null && cmake --build --preset $preset"
  stage "$preset tests" ctest --preset "$preset" -j2
done

# Compile only: clang must see no warning either, and its -Wthread-safety checks what the
# dispatch mutex guards.
stage "clang build" bash -c "cmake --preset clang >/dev/null && cmake --build --preset clang"

# Fuzzing smoke run: each target about half a minute from the seed corpus. New inputs go
# to a scratch copy; a crash fails the run and its input is kept for the corpus.
fuzz_smoke() {
  cmake --preset fuzz >/dev/null
  cmake --build --preset fuzz
  local target scratch
  for target in dispatch_line serial_lines; do
    scratch="$FTCMD_TEST_TMP/fuzz-$target"
    mkdir -p "$scratch/corpus" "$scratch/crash"
    if ! "build/fuzz/fuzz/$target" -max_total_time="${FTCMD_FUZZ_SECONDS:-30}" -timeout=25 \
        -print_final_stats=1 -artifact_prefix="$scratch/crash/" \
        "$scratch/corpus" "tests/fuzz/corpus/$target" >"$scratch/log" 2>&1; then
      tail -40 "$scratch/log"
      mkdir -p build/fuzz-crashes
      cp "$scratch"/crash/* build/fuzz-crashes/ 2>/dev/null || true
      echo "fuzz target $target failed; its input is in build/fuzz-crashes/"
      exit 1
    fi
    grep -E '^stat::number_of_executed_units' "$scratch/log" || true
    rm -rf "$scratch"
  done
}
stage "fuzz smoke" fuzz_smoke

# Every test stops what it started and removes its sandbox: nothing may be left here.
left=$(find "$FTCMD_TEST_TMP" -mindepth 1 -maxdepth 1 2>/dev/null || true)
if [ -n "$left" ]; then
  echo "tests left sandboxes behind:"; echo "$left"
  rm -rf "$FTCMD_TEST_TMP"
  exit 1
fi
rmdir "$FTCMD_TEST_TMP"
echo "== timings"; printf '%s\n' "${timings[@]}"
