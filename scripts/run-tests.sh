#!/usr/bin/env bash
# Installs the dependencies, builds everything and runs the whole test suite:
# on the normal build; under AddressSanitizer and UndefinedBehaviorSanitizer;
# under ThreadSanitizer on the portable build (no hand-written vector code);
# and a bounded run of each fuzz target. --quick stops after the first.
set -euo pipefail
cd "$(dirname "$0")/.."

if [ "$(id -u)" -eq 0 ]; then
  bash scripts/install-deps.sh
else
  sudo bash scripts/install-deps.sh
fi

jobs=$(nproc)
# Nets run at batch one; the matrix library's own threads only add noise to
# the sanitizers.
export OPENBLAS_NUM_THREADS=1

cmake -S . -B build -DCMAKE_BUILD_TYPE=Release
cmake --build build -j "$jobs"
ctest --test-dir build --output-on-failure -j "$jobs"
if [ "${1:-}" = "--quick" ]; then
  exit 0
fi

# Checked builds: no benchmarks, debug information for the reports.
checked() {
  local dir=$1
  shift
  cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=RelWithDebInfo -DTAVI_BUILD_BENCHMARKS=OFF "$@"
  cmake --build "$dir" -j "$jobs"
  ctest --test-dir "$dir" --output-on-failure -j "$jobs"
}
ASAN_OPTIONS=allocator_may_return_null=1:detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
  checked build-asan -DTAVI_SANITIZE=address,undefined,float-cast-overflow,float-divide-by-zero
GTEST_DEATH_TEST_STYLE=threadsafe \
  TSAN_OPTIONS="halt_on_error=1 allocator_may_return_null=1 suppressions=$PWD/tests/tsan.supp" \
  checked build-tsan -DTAVI_SANITIZE=thread -DTAVI_PORTABLE=ON

bash scripts/run-fuzzers.sh 60
