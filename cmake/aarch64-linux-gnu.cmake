# Cross build for 64-bit Arm Linux with Debian's cross toolchain
# (g++-aarch64-linux-gnu). tools/test-arm64.sh builds tolkd and the unit tests
# with it and runs them under qemu-user; see docs/ARM64.md.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR aarch64)

set(CMAKE_C_COMPILER aarch64-linux-gnu-gcc)
set(CMAKE_CXX_COMPILER aarch64-linux-gnu-g++)

# The target's headers and libraries only; programs run during the build are the host's.
list(APPEND CMAKE_FIND_ROOT_PATH /usr/aarch64-linux-gnu)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

# Static, so that qemu-aarch64 runs every program without a target library root (-L).
set(CMAKE_EXE_LINKER_FLAGS_INIT "-static")

# ctest (and gtest's test discovery) run the built programs through qemu-user.
find_program(TOLK_QEMU_AARCH64 qemu-aarch64)
if(TOLK_QEMU_AARCH64)
  set(CMAKE_CROSSCOMPILING_EMULATOR ${TOLK_QEMU_AARCH64})
endif()
