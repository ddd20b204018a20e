#!/usr/bin/env bash
# Installs the Debian packages the console needs (runtime), or those and the
# ones the tests add (test, the default), or only the test VM's (vm). Runs apt-get update only when
# something is missing.
set -euo pipefail

# runtime: what the console needs to build and run; test: what the test command adds.
runtime=(
  build-essential cmake ninja-build pkg-config git
  android-liblog-dev android-libutils-dev
  openjdk-17-jdk-headless
)
test=(
  junit5 libgoogle-gson-java
  libgtest-dev libgmock-dev libbenchmark-dev
  clang libclang-rt-dev
  bluez-test-tools tshark
  chromium
  soong mini-soong
  cloc
)
# The VM the user-channel test boots (scripts/kernel-vm.sh): this machine's
# kernel has no Bluetooth, Debian's has it as modules.
vm=(qemu-system-x86 linux-image-amd64 busybox-static xz-utils)
case ${1:-test} in
  runtime) packages=("${runtime[@]}") ;;
  test) packages=("${runtime[@]}" "${test[@]}" "${vm[@]}") ;;
  vm) packages=("${vm[@]}") ;;
  *) echo "usage: install-deps.sh [runtime|test|vm]" >&2; exit 2 ;;
esac

missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
done
if [ ${#missing[@]} -eq 0 ]; then
  exit 0
fi
echo "installing: ${missing[*]}"
if [ "$(id -u)" -ne 0 ]; then
  echo "error: packages missing (${missing[*]}); run as root or install them with apt-get" >&2
  exit 1
fi
export DEBIAN_FRONTEND=noninteractive
apt-get update -qq
# The kernel is only booted in a VM with an initramfs of its own: building the
# host's (INITRD=No skips it) would only cost time.
INITRD=No apt-get install -y -qq --no-install-recommends "${missing[@]}"
