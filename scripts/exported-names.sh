#!/usr/bin/env bash
# The names a libhalvenor.so exports, one a line, sorted. The host build's are
# the reference the Android.bp and aarch64 builds are held to.
#   bash scripts/exported-names.sh                build/main's, brought up to date first
#   bash scripts/exported-names.sh LIBRARY [NM]   another build's, read with NM (default nm)
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)

if [ $# -eq 0 ]; then
  # The test command has just built it; a step run alone configures it here.
  if [ ! -f "$root/build/main/build.ninja" ]; then
    JAVA_HOME=${JAVA_HOME:-/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)} \
      cmake -S "$root" -B "$root/build/main" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
  fi
  if ! cmake --build "$root/build/main" -j "$(nproc)" --target halvenor >/dev/null; then
    echo "error: the CMake build of libhalvenor.so in build/main failed" >&2
    exit 1
  fi
  set -- "$root/build/main/libhalvenor.so"
fi
"${2:-nm}" -D --defined-only "$1" | awk '{print $NF}' | sort -u
