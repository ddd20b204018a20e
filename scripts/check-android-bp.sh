#!/usr/bin/env bash
# Checks Android.bp with Debian's packages of the platform's tooling: bpfix parses it and finds nothing
# to reformat, mini-soong builds libhalvenor.so from it, exporting the CMake build's names exactly.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
work=$root/build/android-bp
jdk=/usr/lib/jvm/java-17-openjdk-$(dpkg --print-architecture)
started=$(date +%s)

fail() { echo "error: $*" >&2; exit 1; }

for tool in bpfix mini-soong; do
  command -v "$tool" >/dev/null || fail "$tool not found: bash scripts/install-deps.sh installs it"
done
[ -f "$root/Android.bp" ] || fail "no Android.bp at the top of the tree"
# A platform build reads every Android.bp under the tree, build/ included.
other=$(find "$root" -path "$root/.git" -prune -o -name Android.bp ! -path "$root/Android.bp" -print -quit)
[ -z "$other" ] || fail "${other#"$root"/}: a platform build would read this Android.bp too"

# 1. The platform's Blueprint parser and formatter. bpfix exits 0 whatever it
#    finds: parse errors go to stderr, formatting diffs to stdout.
fix=$(cd "$root" && bpfix -d Android.bp 2>&1) || fail "bpfix failed on Android.bp: $fix"
if [ -n "$fix" ]; then
  if grep -q "parsing error" <<<"$fix"; then
    fail "Android.bp does not parse: $(head -n 1 <<<"$fix")"
  fi
  echo "$fix" >&2
  fail "Android.bp is not formatted as bpfmt formats it (diff above; bpfix -w Android.bp rewrites it)"
fi
echo "bpfix: Android.bp parses and needs no reformatting"

# 2. A scratch tree the way a platform tree holds the module: this tree as
#    vendor/, and host stand-ins under the platform's module names in system/.
#    Their recipe is not named Android.bp, so a platform build never reads it
#    and their names never clash with the real modules.
#    mini-soong reads the recipes in path order and links a module against
#    another only if it has read it already: system/ sorts before vendor/.
rm -rf "$work"
mkdir -p "$work/system"
ln -s "$root" "$work/vendor"
cat >"$work/system/host-standins.bp" <<'EOF'
// Host stand-ins for the platform modules libhalvenor links.

// The HIDL runtime: support types, call status, death notices.
cc_library_shared {
    name: "libhidlbase",
    srcs: ["../vendor/host/hidl/base.cpp"],
    export_include_dirs: ["../vendor/host/hidl/include"],
    shared_libs: ["libutils"],
    cpp_std: "c++17",
}

// The NDK binder of an API 31 device: calls, service manager, status.
cc_library_shared {
    name: "libbinder_ndk",
    srcs: [
        "../vendor/host/binder/status.cpp",
        "../vendor/host/binder/ibinder.cpp",
        "../vendor/host/binder/interface_utils.cpp",
        "../vendor/host/binder/service_manager.cpp",
        "../vendor/host/binder/service_manager_api31.cpp",
    ],
    export_include_dirs: ["../vendor/host/binder/include"],
    cpp_std: "c++17",
}

// The classes the NDK backend generates for android.hardware.bluetooth V1.
cc_library_static {
    name: "android.hardware.bluetooth-V1-ndk",
    srcs: ["../vendor/host/binder/bluetooth_hci*.cpp"],
    export_include_dirs: ["../vendor/host/binder/include"],
    cflags: ["-fPIC"],
    shared_libs: ["libbinder_ndk"],
    cpp_std: "c++17",
}

// IBluetoothHci::getService and the host HAL services behind it, HIDL and AIDL.
cc_library_shared {
    name: "android.hardware.bluetooth@1.0",
    srcs: [
        "../vendor/host/hidl/service_registry.cpp",
        "../vendor/host/hal/*.cpp",
        "../vendor/transport/h4_frame.cpp",
    ],
    local_include_dirs: ["../vendor"],
    shared_libs: [
        "liblog",
        "libutils",
        "libhidlbase",
        "libbinder_ndk",
    ],
    static_libs: ["android.hardware.bluetooth-V1-ndk"],
    cpp_std: "c++17",
}
EOF

cd "$work"
mini-soong '*/*.bp' Makefile 2>mini-soong.log ||
  fail "mini-soong cannot read Android.bp: $(tail -n 1 mini-soong.log)"
cat mini-soong.log >&2

# What mini-soong reads but does not act on, turned into Makefile lines from
# the recipes' own values, so a wrong value in Android.bp still shows here.
# (Debian's python3, the one mini-soong runs under.)
/usr/bin/python3 - "$jdk" >>Makefile 2>props.log <<'EOF' || fail "$(tail -n 1 props.log)"
import sys
from pathlib import Path
from mini_soong.model import Module
from mini_soong.parser import soong

jdk = sys.argv[1]
print("\n# Android.bp properties mini-soong leaves out")
# Debian installs the platform's headers under /usr/include/android.
print("liblog_INCLUDES = -I/usr/include/android")
print("libutils_INCLUDES = -I/usr/include/android")
for bp in sorted(Path(".").glob("*/*.bp")):
    for module in soong.parseString(bp.read_text()):
        if not isinstance(module, Module) or not module.name.startswith("cc_"):
            continue
        props, name = module.arguments, module.arguments["name"]
        if "cpp_std" in props:  # mini-soong compiles every module as C++11
            print(f"{name}_CXXFLAGS += -std={props['cpp_std']}")
        if "-Werror" in props.get("cflags", []):  # mini-soong filters it out
            print(f"{name}_CFLAGS += -Werror")
        if not props.get("allow_undefined_symbols", False):  # Soong's default
            print(f"{name}_LDFLAGS += -Wl,--no-undefined")
        if "version_script" in props:
            print(f"{name}_LDFLAGS += -Wl,--version-script={bp.parent / props['version_script']}")
        for lib in props.get("header_libs", []):
            if lib != "jni_headers":
                sys.exit(f"{bp}: header library {lib} has no host stand-in")
            print(f"{name}_CXXFLAGS += -I{jdk}/include -I{jdk}/include/linux")
        for lib in props.get("static_libs", []):  # mini-soong takes no headers from these
            print(f"{name}_CXXFLAGS += $({lib}_INCLUDES)")
            print(f"{name}.so.$({name}_soversion): {lib}.a")
        for lib in props.get("shared_libs", []):
            # mini-soong links every library as -l<name without its first
            # three letters>, which only works for names starting with lib.
            if not lib.startswith("lib"):
                print(f"{name}_LDLIBS := $(filter-out -l{lib[3:]},$({name}_LDLIBS)) -l:{lib}.so")
EOF

if ! make -j "$(nproc)" libhalvenor.so >make.log 2>&1; then
  # The first compiler, linker or make message that names the fault.
  why=$(grep -v -E "^(cc|ln) |^collect2: |warning:|in function" make.log |
    grep -m 1 -E "error:|undefined reference|/ld: |No rule to make target|\*\*\*" ||
    tail -n 1 make.log)
  fail "the mini-soong build of Android.bp failed: $why (log: build/android-bp/make.log)"
fi
echo "mini-soong: built build/android-bp/libhalvenor.so from Android.bp against the host stand-ins"

# 3. The same exports as the CMake build's libhalvenor.so.
cmake_names=$(bash "$root/scripts/exported-names.sh") || exit 1  # the helper said why
bp_names=$(bash "$root/scripts/exported-names.sh" "$work/libhalvenor.so")
if ! diff <(echo "$cmake_names") <(echo "$bp_names") >&2; then
  fail "the libhalvenor.so built from Android.bp exports other names than the CMake build's (< CMake, > Android.bp)"
fi
echo "exports: the same $(wc -l <<<"$bp_names") names as the CMake build's libhalvenor.so"
echo "Android.bp checked in $(($(date +%s) - started)) s"
