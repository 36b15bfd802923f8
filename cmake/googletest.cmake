# GoogleTest for the machine that the tests run on: the installed one, or for a cross build Debian's sources
# (package googletest) built with the cross compiler, since no library of the target is packaged.

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
  # Test programs are not shipped: the time to compile counts, the time they run does not.
  target_compile_options(${library} PRIVATE -O0 -w)
  if(NOT TARGET GTest::${library})
    add_library(GTest::${library} ALIAS ${library})
  endif()
endforeach()
