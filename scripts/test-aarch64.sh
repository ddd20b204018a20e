#!/usr/bin/env bash
# Cross-builds the library, the host layer and the C++ suites for 64-bit Arm,
# runs the suites under qemu-aarch64, and checks that the aarch64
# libhalvenor.so exports exactly the names the host build's does.
# Installs what it needs (as root): the cross toolchain, qemu-user and the
# arm64 builds of the Debian packages the library links (multiarch).
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
bash "$root/scripts/install-deps.sh"

export JAVA_HOME=/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)
jobs=$(nproc)
overlay=$root/build/aarch64-sysroot

step() { echo; echo "=== $* ==="; }

arm64_packages=(
  g++-aarch64-linux-gnu binutils-aarch64-linux-gnu qemu-user
  android-liblog-dev:arm64 android-libutils-dev:arm64
  libgtest-dev:arm64 libgmock-dev:arm64
)

install_arm64() {
  local missing=() p
  for p in "${arm64_packages[@]}"; do
    dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
  done
  [ ${#missing[@]} -eq 0 ] && return 0
  echo "installing: ${missing[*]}"
  if [ "$(id -u)" -ne 0 ]; then
    echo "error: packages missing (${missing[*]}); run as root" >&2
    exit 1
  fi
  export DEBIAN_FRONTEND=noninteractive
  dpkg --print-foreign-architectures | grep -qx arm64 || dpkg --add-architecture arm64
  apt-get update -qq
  # The arm64 Android -dev packages are Multi-Arch: same and install beside
  # the amd64 ones the host build uses; nothing is removed.
  apt-get install -y -qq --no-install-recommends "${missing[@]}"
}

# libbacktrace (under libutils) needs 7z.so of p7zip-full, which is not
# multiarch: its arm64 build goes into an overlay that the toolchain file links
# against and qemu looks into before the real root.
fill_overlay() {
  [ -f "$overlay/usr/lib/p7zip/7z.so" ] && return 0
  local tmp
  tmp=$(mktemp -d)
  chmod 777 "$tmp"  # apt-get download fetches as the _apt user where it can write
  (cd "$tmp" && apt-get download -qq p7zip-full:arm64 && dpkg-deb -x p7zip-full_*_arm64.deb unpacked)
  mkdir -p "$overlay/usr/lib/p7zip"
  cp "$tmp/unpacked/usr/lib/p7zip/7z.so" "$overlay/usr/lib/p7zip/"
  rm -rf "$tmp"
}

same_names() {  # same_names <what> <host names> <aarch64 names>
  if ! diff <(echo "$2") <(echo "$3"); then
    echo "error: $1 exports other names than the host build's (< host, > aarch64)" >&2
    exit 1
  fi
}

step "install the aarch64 toolchain, qemu-user and the arm64 packages"
install_arm64
fill_overlay

step "host libhalvenor.so (reference for the exported names)"
names=$(bash "$root/scripts/exported-names.sh")

step "aarch64 build (aarch64-linux-gnu-g++, -Wall -Wextra -Werror)"
cmake -S "$root" -B "$root/build/aarch64" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DCMAKE_TOOLCHAIN_FILE="$root/cmake/toolchain-aarch64.cmake" -DHALVENOR_JAVA=OFF >/dev/null
cmake --build "$root/build/aarch64" -j "$jobs"
aarch64-linux-gnu-readelf -h "$root/build/aarch64/libhalvenor.so" | grep Machine

step "aarch64 libhalvenor.so with clang, the platform's compiler (-Wall -Wextra -Werror)"
cmake -S "$root" -B "$root/build/aarch64-clang" -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo \
  -DCMAKE_TOOLCHAIN_FILE="$root/cmake/toolchain-aarch64.cmake" -DHALVENOR_JAVA=OFF -DHALVENOR_TESTS=OFF \
  -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ >/dev/null
cmake --build "$root/build/aarch64-clang" -j "$jobs" --target halvenor

step "exported names: aarch64 against host"
same_names "the aarch64 libhalvenor.so" "$names" \
  "$(bash "$root/scripts/exported-names.sh" "$root/build/aarch64/libhalvenor.so" aarch64-linux-gnu-nm)"
echo "gcc: the same $(echo "$names" | wc -l) exported names"
same_names "the aarch64 libhalvenor.so built by clang" "$names" \
  "$(bash "$root/scripts/exported-names.sh" "$root/build/aarch64-clang/libhalvenor.so" aarch64-linux-gnu-nm)"
echo "clang: the same $(echo "$names" | wc -l) exported names"

step "C++ suites under qemu-aarch64"
ctest --test-dir "$root/build/aarch64" --output-on-failure -j "$jobs" -L cxx

echo
echo "aarch64 build and test run passed"
