#!/bin/sh
# Builds and runs the whole test suite:
#   asan - native Debug with AddressSanitizer and UndefinedBehaviorSanitizer
#   tsan - native with ThreadSanitizer
#   arm  - the 32-bit ARM product build, every test under qemu-arm
#   release - native optimised build with the benchmarks compiled
set -eu
cd "$(dirname "$0")/.."
JOBS=$(nproc)

run() {
  name=$1
  shift
  echo "=== $name"
  cmake -S . -B "build/$name" -G Ninja "$@" >/dev/null
  cmake --build "build/$name" -j "$JOBS"
  (cd "build/$name" && ctest --output-on-failure -j "$JOBS")
}

run asan -DCMAKE_BUILD_TYPE=Debug -DPXALARMS_SANITIZE=address,undefined
# Thread sanitizer's shadow memory needs the fixed address layout.
TSAN_OPTIONS="halt_on_error=1 second_deadlock_stack=1" \
  setarch "$(uname -m)" -R sh -c "$(cat <<'INNER'
set -eu
cmake -S . -B build/tsan -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DPXALARMS_SANITIZE=thread >/dev/null
cmake --build build/tsan -j "$(nproc)"
cd build/tsan && ctest --output-on-failure -j "$(nproc)"
INNER
)"
run arm -DCMAKE_BUILD_TYPE=RelWithDebInfo -DCMAKE_TOOLCHAIN_FILE=cmake/arm-linux-gnueabihf.cmake
run release -DCMAKE_BUILD_TYPE=Release -DPXALARMS_BUILD_BENCH=ON
echo "=== all test builds passed"
