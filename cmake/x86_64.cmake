# Linux on x86-64, as it is released: this machine's compiler with libraries old enough for every host in use.

include(${CMAKE_CURRENT_LIST_DIR}/sysroot.cmake)
set(CMAKE_CXX_COMPILER g++)
orvpatch_sysroot(x86_64 x86_64-linux-gnu)
