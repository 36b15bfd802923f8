# Linux on POWER, big endian: nothing is shipped for it. The unit tests run here to show that no result
# depends on the order of bytes.

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ppc64)
include(${CMAKE_CURRENT_LIST_DIR}/cross.cmake)
orvpatch_cross_toolchain(powerpc64-linux-gnu qemu-ppc64)
