# Linux on POWER, little endian: Debian's cross compiler, and its user-mode emulator for the unit tests.

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ppc64le)
include(${CMAKE_CURRENT_LIST_DIR}/cross.cmake)
orvpatch_cross_toolchain(powerpc64le-linux-gnu qemu-ppc64le)
