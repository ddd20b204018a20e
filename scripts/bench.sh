#!/usr/bin/env bash
# Builds the benchmarks in build/bench (Release, no sanitizers) and runs them:
# the C++ benchmarks (exchange latency, pump throughput, session cost, idle
# cost, each against its baseline in the same binary, repetitions
# interleaved), then the Java benchmark against the simulated controller.
# Prints the machine, its load before and after, every figure and the ratios
# (also kept in build/bench/results.txt, the raw figures in bench.json).
# Not part of the tests. Usage: bash scripts/bench.sh [extra benchmark flags]
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
bash "$root/scripts/install-deps.sh"

export JAVA_HOME=/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)
build=$root/build/bench
jobs=$(( $(nproc) < 2 ? $(nproc) : 2 ))

step() { echo; echo "=== $* ==="; }

step "build (Release, -DHALVENOR_BENCH=ON)"
cmake -S "$root" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Release -DHALVENOR_SANITIZE= \
  -DHALVENOR_BENCH=ON -DHALVENOR_TESTS=OFF -DHALVENOR_JAVA=ON >/dev/null
cmake --build "$build" -j "$jobs" --target halvenor_bench halvenor halvenor_jar halvenor_bench_java

# Everything from here on is also kept in build/bench/results.txt.
exec > >(tee "$build/results.txt")

step "machine"
lscpu | grep -E '^(Model name|CPU\(s\)|Thread\(s\) per core|Core\(s\) per socket|Hypervisor vendor):' || true
echo "kernel: $(uname -r)"
echo "load before: $(uptime)"

# The library logs every packet; its log goes to stderr on a host, sent to
# /dev/null here so that the terminal's speed is not measured.
step "C++ benchmarks (library log to /dev/null; 'log raised' lines: its minimum priority raised to silent)"
"$build/bench/halvenor_bench" --benchmark_enable_random_interleaving=true \
  --benchmark_report_aggregates_only=true --benchmark_out="$build/bench.json" \
  --benchmark_out_format=json "$@" 2>/dev/null

step "Java benchmark (HALVENOR_HCI=sim: the simulated controller, answering at once)"
HALVENOR_HCI=sim env -u HALVENOR_BTSNOOP "$JAVA_HOME/bin/java" -Djava.library.path="$build" \
  -cp "$build/bench/halvenor_bench_java.jar:$build/java/halvenor.jar" \
  com.quorvex.halvenor.bench.JavaBench 50 2>/dev/null

echo
echo "load after: $(uptime)"
