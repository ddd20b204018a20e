# Cross-builds for 64-bit Arm with Debian's cross toolchain (g++-aarch64-linux-gnu)
# against the arm64 multiarch packages (libraries under /usr/lib/aarch64-linux-gnu),
# and runs what it builds (CTest, the suites) under qemu-aarch64.
# scripts/test-aarch64.sh installs all of it and fills the overlay below.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR aarch64)

# Debian's cross gcc by default; -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++
# builds with clang for the same target instead, the platform's compiler.
if(NOT CMAKE_C_COMPILER)
  set(CMAKE_C_COMPILER aarch64-linux-gnu-gcc)
endif()
if(NOT CMAKE_CXX_COMPILER)
  set(CMAKE_CXX_COMPILER aarch64-linux-gnu-g++)
endif()
set(CMAKE_C_COMPILER_TARGET aarch64-linux-gnu)
set(CMAKE_CXX_COMPILER_TARGET aarch64-linux-gnu)
set(CMAKE_LIBRARY_ARCHITECTURE aarch64-linux-gnu)

# Debian's libbacktrace (under libutils) needs 7z.so of p7zip-full, a package
# that is not multiarch: its arm64 build is unpacked into this overlay rather
# than replacing the build machine's own /usr/lib/p7zip.
get_filename_component(HALVENOR_AARCH64_OVERLAY ${CMAKE_CURRENT_LIST_DIR}/../build/aarch64-sysroot ABSOLUTE)
set(CMAKE_EXE_LINKER_FLAGS_INIT "-Wl,-rpath-link,${HALVENOR_AARCH64_OVERLAY}/usr/lib/p7zip")
set(CMAKE_SHARED_LINKER_FLAGS_INIT "-Wl,-rpath-link,${HALVENOR_AARCH64_OVERLAY}/usr/lib/p7zip")

# Everything else arm64 (libc6, libstdc++6, the Android libraries) is installed
# at its multiarch path, so qemu looks in the overlay first and falls back to
# the real root: the binaries' own loader then loads the libc it belongs with.
find_program(HALVENOR_QEMU_AARCH64 qemu-aarch64 REQUIRED)
set(CMAKE_CROSSCOMPILING_EMULATOR ${HALVENOR_QEMU_AARCH64} -L ${HALVENOR_AARCH64_OVERLAY})
