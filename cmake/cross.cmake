# What the tool chains of the targets have in common: Debian names compiler and C library after the triplet.

macro(orvpatch_cross_toolchain triplet emulator)
  set(CMAKE_C_COMPILER ${triplet}-gcc) # for GoogleTest's build, which asks for one
  set(CMAKE_CXX_COMPILER ${triplet}-g++)
  set(CMAKE_CXX_COMPILER_TARGET ${triplet})
  # -L: the emulated program finds the target's dynamic loader and C library below this folder.
  set(CMAKE_CROSSCOMPILING_EMULATOR ${emulator} -L /usr/${triplet})

  # Programs that the build runs are the host's; libraries, headers and packages are the target's.
  set(CMAKE_FIND_ROOT_PATH /usr/${triplet})
  set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
  set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
  set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
  set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
endmacro()
