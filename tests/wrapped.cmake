# The calls that have a stand-in in support/systemcalls.cpp; a new one is added in both places.
set(wrapped_calls
  __open_2
  __openat_2
  access
  chdir
  chmod
  chown
  close
  dup2
  execvp
  fchmod
  fchown
  fcntl
  fork
  fstatat
  fsync
  ftruncate
  getcwd
  getpwuid
  getuid
  link
  localtime
  localtime_r
  lseek
  lstat
  malloc
  mkdir
  open
  openat
  opendir
  pipe
  putenv
  read
  readdir
  rmdir
  stat
  syncfs
  time
  uname
  unlink
  wait
  write)
# The C library that the packages are built with has other names for the calls that look at a file.
if(ORVPATCH_SYSROOT)
  list(REMOVE_ITEM wrapped_calls fstatat lstat stat)
  list(APPEND wrapped_calls __fxstatat __lxstat __xstat)
endif()
list(TRANSFORM wrapped_calls PREPEND "LINKER:--wrap=" OUTPUT_VARIABLE wrap_options)

add_executable(wrapped_tests ${wrapped_tests} ${support} support/systemcalls.cpp)
target_include_directories(wrapped_tests PRIVATE support)
target_compile_definitions(wrapped_tests PRIVATE ${support_folder})
target_link_libraries(wrapped_tests PRIVATE orvpatch_core GTest::gmock GTest::gtest_main)
target_link_options(wrapped_tests PRIVATE ${wrap_options})
orvpatch_test_code(wrapped_tests)
target_precompile_headers(wrapped_tests REUSE_FROM unit_tests)
