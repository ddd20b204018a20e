#!/usr/bin/env bash
# Builds and runs every test: the plain build (C++ and JVM suites), the checks
# of Android.bp (bpfix, a mini-soong build and its exports), the C++
# suites under AddressSanitizer + UndefinedBehaviorSanitizer, the threaded
# suites under ThreadSanitizer, the C++ suites cross-built for aarch64 under
# qemu (scripts/test-aarch64.sh), and the console on a real kernel's HCI user
# channel in a VM (scripts/kernel-vm.sh, tests/vm/user_channel.sh). Fails on
# any failing test or sanitizer report, and when the VM cannot start.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
bash "$root/scripts/install-deps.sh" test

export JAVA_HOME=/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)
jobs=$(nproc)

build() {  # build <dir> <cmake args...>
  local dir=$1; shift
  cmake -S "$root" -B "$root/build/$dir" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo "$@" >/dev/null
  cmake --build "$root/build/$dir" -j "$jobs"
}

step() { echo; echo "=== $* ==="; }

step "build and test (gcc, -Wall -Wextra -Werror)"
build main -DHALVENOR_TESTS=ON
ctest --test-dir "$root/build/main" --output-on-failure -j "$jobs"

step "Android.bp: bpfix, and libhalvenor.so built from it by mini-soong"
bash "$root/scripts/check-android-bp.sh"

step "C++ suites under AddressSanitizer + UndefinedBehaviorSanitizer"
build asan -DHALVENOR_SANITIZE=address -DHALVENOR_JAVA=OFF
ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
  ctest --test-dir "$root/build/asan" --output-on-failure -j "$jobs" -L cxx

step "threaded suites under ThreadSanitizer"
build tsan -DHALVENOR_SANITIZE=thread -DHALVENOR_JAVA=OFF
TSAN_OPTIONS="halt_on_error=1 second_deadlock_stack=1 suppressions=$root/tests/tsan.supp" \
  ctest --test-dir "$root/build/tsan" --output-on-failure -j "$jobs" -L threaded

step "fuzz target, 30 s (long campaign: bash scripts/fuzz.sh 3600)"
bash "$root/scripts/fuzz.sh" 30

step "aarch64 cross build and C++ suites under qemu-aarch64"
bash "$root/scripts/test-aarch64.sh"

step "the kernel's HCI user channel, in a VM with Debian's kernel (about 40 s)"
bash "$root/scripts/kernel-vm.sh" --timeout 150 --env HALVENOR_BUILD_DIR="$root/build/main" --env HALVENOR_NO_BUILD=1 \
  -- bash "$root/tests/vm/user_channel.sh"

echo
echo "all test runs passed"
