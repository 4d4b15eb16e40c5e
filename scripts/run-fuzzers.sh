#!/usr/bin/env bash
# Builds the libFuzzer targets with clang (AddressSanitizer and
# UndefinedBehaviorSanitizer on) and runs each for SECONDS (default 60) from
# its seed corpus in tests/fuzz/corpus/. A crash stops the script with the
# failing input under build-fuzz/. The seed is fixed, so that a run repeats
# the mutations of an earlier one as far as its time allows.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds=${1:-60}

CC=clang CXX=clang++ cmake -S . -B build-fuzz -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DTAVI_BUILD_FUZZERS=ON -DTAVI_BUILD_TOOLS=OFF -DTAVI_BUILD_TESTS=OFF -DTAVI_BUILD_BENCHMARKS=OFF
cmake --build build-fuzz -j "$(nproc)" --target net_parsers_fuzz landmark_model_fuzz cascade_files_fuzz
for target in net_parsers landmark_model cascade_files; do
  corpus=build-fuzz/corpus/$target
  mkdir -p "$corpus"
  OPENBLAS_NUM_THREADS=1 "build-fuzz/tests/fuzz/${target}_fuzz" -seed=1 -max_total_time="$seconds" \
    -rss_limit_mb=4096 -timeout=60 -artifact_prefix="build-fuzz/${target}-" \
    "$corpus" "tests/fuzz/corpus/$target"
done
