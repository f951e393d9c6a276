#!/bin/sh
# Hardening checks beside the unit suite:
#  1. the fuzz harnesses (clang libFuzzer with AddressSanitizer and
#     UndefinedBehaviorSanitizer), each run for a few seconds on its seed
#     corpus in fuzz/corpus (FUZZ_SECONDS, default 5);
#  2. a ThreadSanitizer build of the unit tests, running the tests of many
#     encoders at once.
# Build folders: build-fuzz and build-tsan. Installs nothing: without clang
# (or its sanitizer run-times) it says so and skips.
set -eu
cd "$(dirname "$0")/.."
SECONDS_EACH=${FUZZ_SECONDS:-5}
JOBS=${JOBS:-2}

if ! command -v clang++ >/dev/null 2>&1 || ! command -v clang >/dev/null 2>&1; then
  echo "== hardening: clang not found; fuzzing and ThreadSanitizer skipped"
  exit 0
fi
probe=$(mktemp -d)
trap 'rm -rf "$probe"' EXIT
printf 'extern "C" int LLVMFuzzerTestOneInput(const unsigned char*, unsigned long) { return 0; }\n' > "$probe/f.cpp"
if ! clang++ -fsanitize=fuzzer,address,undefined "$probe/f.cpp" -o "$probe/f" >/dev/null 2>&1; then
  echo "== hardening: clang has no libFuzzer run-time (libclang-rt-dev); fuzzing and ThreadSanitizer skipped"
  exit 0
fi

echo "== fuzz harnesses (libFuzzer, ASan, UBSan): ${SECONDS_EACH} s each on the seed corpus"
cmake -S fuzz -B build-fuzz -G Ninja -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ >/dev/null
cmake --build build-fuzz -j "$JOBS"
for corpus in fuzz/corpus/*/; do
  name=$(basename "$corpus")
  # Work on a copy: the repository's corpus stays as it is.
  work="build-fuzz/corpus-$name"
  rm -rf "$work" && mkdir -p "$work" && cp "$corpus"* "$work"/
  if ! "build-fuzz/fuzz_$name" -max_total_time="$SECONDS_EACH" -max_len=512 -print_final_stats=1 \
      -artifact_prefix="build-fuzz/finding-$name-" "$work" >"build-fuzz/fuzz_$name.log" 2>&1; then
    tail -40 "build-fuzz/fuzz_$name.log"
    echo "== fuzz_$name found a fault; the input is in build-fuzz/finding-$name-*"
    exit 1
  fi
  runs=$(sed -n 's/^stat::number_of_executed_units: *//p' "build-fuzz/fuzz_$name.log")
  speed=$(sed -n 's/^stat::average_exec_per_sec: *//p' "build-fuzz/fuzz_$name.log")
  echo "fuzz_$name: $runs runs, $speed per second, no finding"
done

echo "== ThreadSanitizer: many encoders at once, one image coded by many threads"
cmake -S . -B build-tsan -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_C_COMPILER=clang \
  -DCMAKE_CXX_COMPILER=clang++ -DCMAKE_CXX_FLAGS=-fsanitize=thread -DCMAKE_C_FLAGS=-fsanitize=thread \
  -DCMAKE_EXE_LINKER_FLAGS=-fsanitize=thread -DCMAKE_SHARED_LINKER_FLAGS=-fsanitize=thread \
  -DTEKOJ_BUILD_TESTS=ON -DTEKOJ_WERROR=ON -DTEKOJ_BUILD_BENCH=OFF -DTEKOJ_BUILD_TOOLS=OFF >/dev/null
cmake --build build-tsan -j "$JOBS" --target tekoj_tests
TSAN_OPTIONS="halt_on_error=1 second_deadlock_stack=1" build-tsan/tests/tekoj_tests \
  --gtest_filter='Threads.*:Parallel.*:ExifBlock.DateStampIsNowAndThreadSafe:Misuse.BadFormatsAndDimensionsAreRefusedByEveryOutputKind'
echo "== hardening passed"
