# Linux on POWER, little endian: Debian's cross compiler, libraries old enough for every host in use, and Debian's
# user-mode emulator, which runs the programs with these libraries.

set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ppc64le)
include(${CMAKE_CURRENT_LIST_DIR}/cross.cmake)
orvpatch_cross_toolchain(powerpc64le-linux-gnu qemu-ppc64le)
include(${CMAKE_CURRENT_LIST_DIR}/sysroot.cmake)
orvpatch_sysroot(ppc64le powerpc64le-linux-gnu)
# The short cut for thread-local variables would ask for glibc 2.22.
string(APPEND CMAKE_EXE_LINKER_FLAGS " -Wl,--no-tls-get-addr-optimize")
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-ppc64le -L ${ORVPATCH_SYSROOT}/usr/powerpc64le-linux-gnu)
