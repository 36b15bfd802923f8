# Read by cpack before each kind of package. A kind takes the files of "program" and its own component.

list(GET CPACK_BUILD_SOURCE_DIRS 1 build)
set(own site)
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
if(CPACK_GENERATOR STREQUAL DEB)
  set(own debian)
  file(READ ${build}/libc-level libc_level)
  string(STRIP ${libc_level} libc_level)
  # tar, grep, su and sh are in packages that every Debian system has, which are not named in dependencies.
  set(CPACK_DEBIAN_PACKAGE_DEPENDS "libc6 (>= ${libc_level}), procps")
elseif(CPACK_GENERATOR STREQUAL RPM)
  set(CPACK_RPM_PACKAGE_SUMMARY "Patch installer of the ORV monitoring product")
elseif(CPACK_GENERATOR STREQUAL External)
  # To be unpacked below any prefix.
  set(CPACK_PACKAGING_INSTALL_PREFIX /)
endif()
set(CPACK_INSTALL_CMAKE_PROJECTS "${build};orvpatch;program;/;${build};orvpatch;${own};/")
