#!/usr/bin/env bash
# Builds the libFuzzer target (clang, ASan + UBSan + LeakSanitizer) in
# build/fuzz and runs each for N seconds (default 30) from its seed corpus in
# fuzz/corpus/<target>; prints executions and crashes per target and exits
# non-zero when any target crashed, leaked or timed out.
#   bash scripts/fuzz.sh          short run, part of scripts/test-all.sh
#   bash scripts/fuzz.sh 3600     long campaign: an hour per target
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
seconds=${1:-30}
jobs=${HALVENOR_JOBS:-$(nproc)}
export JAVA_HOME=${JAVA_HOME:-/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)}

build="$root/build/fuzz"
cmake -S "$root" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ \
  -DHALVENOR_FUZZ=ON -DHALVENOR_SANITIZE=address -DHALVENOR_JAVA=OFF -DHALVENOR_TESTS=OFF >/dev/null
cmake --build "$build" -j "$jobs" --target \
  event_reader_fuzzer

# <target> <largest input>: a command code, a PHY bit and a controller's answer.
targets=(
  "event_reader_fuzzer 4096"
)

# Short runs (the test command's) start from a fixed seed so that a CI run can
# be repeated exactly; campaigns explore from a random one.
seed_arg=()
if [ "$seconds" -le 120 ]; then seed_arg=(-seed="${HALVENOR_FUZZ_SEED:-1}"); fi

export ASAN_OPTIONS=detect_leaks=1:abort_on_error=1:allocator_may_return_null=1
export UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1
failed=0
printf '%-24s %12s %10s %8s\n' target executions exec/s crashes
for entry in "${targets[@]}"; do
  read -r target max_len <<<"$entry"
  work="$build/run/$target"
  rm -rf "$work" && mkdir -p "$work/corpus" "$work/artifacts"
  # New inputs go to a scratch corpus; the committed seeds stay as they are.
  log="$work/fuzz.log"
  status=0
  (cd "$work" && "$build/fuzz/$target" "$work/corpus" "$root/fuzz/corpus/$target" \
      -max_total_time="$seconds" -max_len="$max_len" -timeout=25 -rss_limit_mb=2048 \
      -print_final_stats=1 "${seed_arg[@]}" -artifact_prefix="$work/artifacts/") >"$log" 2>&1 || status=$?
  execs=$(sed -n 's/^stat::number_of_executed_units: *//p' "$log" | tail -1)
  rate=$(sed -n 's/^stat::average_exec_per_sec: *//p' "$log" | tail -1)
  crashes=$(find "$work/artifacts" -type f | wc -l)
  if [ "$status" -ne 0 ] && [ "$crashes" -eq 0 ]; then crashes=1; fi
  printf '%-24s %12s %10s %8s\n' "$target" "${execs:-?}" "${rate:-?}" "$crashes"
  if [ "$crashes" -ne 0 ]; then
    failed=1
    echo "--- $target: exit $status, artifacts in $work/artifacts; end of its log:"
    tail -40 "$log"
  fi
done
if [ "$failed" -ne 0 ]; then
  echo "fuzzing found crashes" >&2
  exit 1
fi
echo "fuzzing: no crashes"
