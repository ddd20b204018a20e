#!/usr/bin/env bash
# Installs the Debian packages the build, the console and the tests need.
# Runs apt-get update only when something is missing.
set -euo pipefail

packages=(
  build-essential cmake ninja-build pkg-config
  android-liblog-dev android-libutils-dev
  openjdk-17-jdk-headless junit5 libgoogle-gson-java
  libgtest-dev libgmock-dev libbenchmark-dev
  clang libclang-rt-dev
  bluez-test-tools tshark
  chromium
  soong mini-soong
  cloc
)

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
apt-get install -y -qq --no-install-recommends "${missing[@]}"
