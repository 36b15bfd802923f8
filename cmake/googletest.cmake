# GoogleTest for the machine that the tests run on: the installed one, or for a cross build Debian's sources
# (package googletest) built with the cross compiler, since no library of the target is packaged.

# orvpatch_test_code(TARGET...): in a cross build, which is an optimised one, only what is tested is optimised.
# The tests themselves are compiled for the time that it takes; the C library would warn that it cannot fortify
# them.
function(orvpatch_test_code)
  if(CMAKE_CROSSCOMPILING)
    foreach(target ${ARGN})
      target_compile_options(${target} PRIVATE -O0 -Wno-cpp)
    endforeach()
  endif()
endfunction()

if(NOT CMAKE_CROSSCOMPILING)
  find_package(GTest REQUIRED)
  return()
endif()

set(ORVPATCH_GOOGLETEST_SOURCE /usr/src/googletest CACHE PATH "Sources of GoogleTest, for cross builds")
if(NOT EXISTS ${ORVPATCH_GOOGLETEST_SOURCE}/CMakeLists.txt)
  message(FATAL_ERROR "No GoogleTest sources in ${ORVPATCH_GOOGLETEST_SOURCE}: install the package googletest")
endif()
set(INSTALL_GTEST OFF CACHE INTERNAL "")
add_subdirectory(${ORVPATCH_GOOGLETEST_SOURCE} ${CMAKE_BINARY_DIR}/googletest EXCLUDE_FROM_ALL SYSTEM)
foreach(library gtest gtest_main gmock gmock_main)
  target_compile_options(${library} PRIVATE -O0 -w)
  if(NOT TARGET GTest::${library})
    add_library(GTest::${library} ALIAS ${library})
  endif()
endforeach()
