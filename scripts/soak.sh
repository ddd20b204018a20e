#!/usr/bin/env bash
# Lifecycle soak: N cycles (default 10000) of open, exchange and close, mixing
# quitTestModeNative and destoryNative, from C++ against a scripted HAL and
# from Java in a real JVM against the simulated controller. Each prints its
# start and end counts and fails on growth. Builds in build/hardening.
#   bash scripts/soak.sh [cycles]
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
cycles=${1:-10000}
jobs=${HALVENOR_JOBS:-$(nproc)}
export JAVA_HOME=${JAVA_HOME:-/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)}
build="$root/build/hardening"

cmake -S "$root" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DHALVENOR_SOAK=ON >/dev/null
cmake --build "$build" -j "$jobs" --target lifecycle_soak halvenor_soak_jar halvenor

echo "=== C++ soak, $cycles cycles ==="
"$build/soak/lifecycle_soak" "$cycles"

# The library logs every step to stderr; a soak's millions of lines are dropped.
echo "=== Java soak (JVM, -Xcheck:jni, simulated controller), $cycles cycles ==="
HALVENOR_HCI=sim "$JAVA_HOME/bin/java" -Xcheck:jni -XX:-UseDynamicNumberOfCompilerThreads \
  -Djava.library.path="$build" \
  -cp "$build/soak/halvenor_soak.jar:$build/java/halvenor.jar" \
  com.quorvex.halvenor.soak.LifecycleSoak "$cycles" 2>/dev/null
