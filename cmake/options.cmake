# How everything here is compiled and linked.

# ccache, where it is installed: what is shipped is compiled under the paths of its own checkout, everything else
# is found again from other checkouts too.
find_program(ORVPATCH_CCACHE ccache)
if(ORVPATCH_CCACHE AND NOT DEFINED CMAKE_CXX_COMPILER_LAUNCHER)
  set(CMAKE_CXX_COMPILER_LAUNCHER env CCACHE_SLOPPINESS=pch_defines,time_macros,include_file_mtime,include_file_ctime)
  if(NOT ORVPATCH_HARDENED)
    list(APPEND CMAKE_CXX_COMPILER_LAUNCHER CCACHE_BASEDIR=${CMAKE_SOURCE_DIR} CCACHE_NOHASHDIR=1)
  endif()
  list(APPEND CMAKE_CXX_COMPILER_LAUNCHER ${ORVPATCH_CCACHE})
endif()

add_library(orvpatch_options INTERFACE)
target_compile_options(orvpatch_options INTERFACE -Wall -Wextra -Wpedantic -Wconversion -Wshadow
  # Precompiled headers whose users ccache can find again.
  $<$<CXX_COMPILER_ID:GNU>:-fpch-preprocess>
  "$<$<CXX_COMPILER_ID:Clang>:SHELL:-Xclang -fno-pch-timestamp>")
if(ORVPATCH_WERROR)
  target_compile_options(orvpatch_options INTERFACE -Werror)
endif()

if(ORVPATCH_SANITIZE)
  target_compile_options(orvpatch_options INTERFACE
    -fsanitize=${ORVPATCH_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
  target_link_options(orvpatch_options INTERFACE -fsanitize=${ORVPATCH_SANITIZE})
endif()

if(ORVPATCH_COVERAGE)
  target_compile_options(orvpatch_options INTERFACE --coverage -O0 -fprofile-abs-path)
  target_link_options(orvpatch_options INTERFACE --coverage)
endif()

# For the program alone: the tests put stand-ins in place of system calls, which a library of their own would
# then use as well.
add_library(orvpatch_runtime INTERFACE)
if(ORVPATCH_STATIC_RUNTIME)
  # Sections that nothing reaches are dropped: with them would go calls of the newest C libraries, which the
  # program never makes but would ask for.
  target_link_options(orvpatch_runtime INTERFACE -static-libstdc++ -static-libgcc -Wl,--gc-sections)
endif()

if(ORVPATCH_HARDENED)
  set(CMAKE_POSITION_INDEPENDENT_CODE ON)
  target_compile_options(orvpatch_options INTERFACE
    -fstack-protector-strong -U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=2
    # The same bytes wherever the sources stand.
    -ffile-prefix-map=${CMAKE_SOURCE_DIR}=.)
  target_link_options(orvpatch_options INTERFACE -pie -Wl,-z,relro,-z,now)
endif()
