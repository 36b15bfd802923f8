# The packages: .deb, .rpm and .tar.gz, of orvpatch and, where it is built, of orvpatchctl: cpack makes those of
# CPACK_ORVPATCH_PROGRAM. Which kinds a build makes, and how their names are spelt, depends on the processor;
# big-endian POWER is only tested, so nothing is packaged for it.

if(CMAKE_SYSTEM_PROCESSOR STREQUAL ppc64le)
  set(CPACK_GENERATOR DEB RPM External)
  set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE ppc64el)
  set(CPACK_RPM_PACKAGE_ARCHITECTURE ppc64le)
elseif(CMAKE_SYSTEM_PROCESSOR STREQUAL x86_64)
  set(CPACK_GENERATOR DEB External)
  set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE amd64)
else()
  return()
endif()

# The debug symbols are packed apart: the packages hold a stripped program.
target_compile_options(orvpatch_core PRIVATE -g)
target_compile_options(orvpatch PRIVATE -g)
set(programs orvpatch)
if(ORVPATCH_CTL)
  target_compile_options(orvpatchctl_core PRIVATE $<$<NOT:$<CONFIG:Debug>>:-g>)
  target_compile_options(orvpatchctl PRIVATE $<$<NOT:$<CONFIG:Debug>>:-g>)
  list(APPEND programs orvpatchctl)
endif()

# The C library's level that a program asks for, kept beside it for the packages to name.
foreach(program ${programs})
  set(level ${CMAKE_BINARY_DIR}/${program}.libc-level)
  add_custom_command(OUTPUT ${level}
    COMMAND ${CMAKE_SOURCE_DIR}/packaging/libc-level ${CMAKE_OBJDUMP} $<TARGET_FILE:${program}> > ${level}
    DEPENDS ${program} VERBATIM)
  list(APPEND levels ${level})
endforeach()
add_custom_target(libc_levels ALL DEPENDS ${levels})

set(CPACK_ORVPATCH_PROGRAM orvpatch)
set(CPACK_ORVPATCH_PROCESSOR ${CMAKE_SYSTEM_PROCESSOR})
set(CPACK_PACKAGE_VENDOR "Norvik")
set(CPACK_PACKAGE_CONTACT "${ORVPATCH_MAINTAINER}")
set(CPACK_PACKAGE_VERSION ${ORVPATCH_PACKAGE_VERSION})
set(CPACK_PACKAGE_DIRECTORY ${CMAKE_BINARY_DIR}/packages)
# Settings that differ by program and kind of package, and what is done to the files before they are packed.
set(CPACK_PROJECT_CONFIG_FILE ${CMAKE_SOURCE_DIR}/packaging/kinds.cmake)
set(CPACK_PRE_BUILD_SCRIPTS ${CMAKE_SOURCE_DIR}/packaging/staged.cmake)
set(CPACK_ORVPATCH_STRIP ${CMAKE_STRIP})
set(CPACK_ORVPATCH_OBJCOPY ${CMAKE_OBJCOPY})
set(CPACK_ORVPATCH_READELF ${CMAKE_READELF})

# The .tar.gz is made by a script: cpack's own would hold the files in the order of the disk.
set(CPACK_EXTERNAL_ENABLE_STAGING ON)
set(CPACK_EXTERNAL_PACKAGE_SCRIPT ${CMAKE_SOURCE_DIR}/packaging/tarball.cmake)

set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_COMPRESSION_TYPE xz)

set(CPACK_RPM_FILE_NAME RPM-DEFAULT)
set(CPACK_RPM_PACKAGE_RELEASE 1)
set(CPACK_RPM_PACKAGE_GROUP "System Environment/Base")
set(CPACK_RPM_PACKAGE_LICENSE "LicenseRef-Proprietary")
set(CPACK_PACKAGE_RELOCATABLE OFF) # this alone: the one for .rpm files cannot take it back
# Folders that belong to the system or to the shells.
foreach(folder sbin share/bash-completion share/bash-completion/completions share/fish
    share/fish/vendor_completions.d share/man share/man/man5 share/man/man8 share/zsh share/zsh/site-functions)
  list(APPEND CPACK_RPM_EXCLUDE_FROM_AUTO_FILELIST_ADDITION /usr/${folder})
endforeach()
set(CPACK_RPM_CHANGELOG_FILE ${CMAKE_BINARY_DIR}/changelog.rpm)
file(READ packaging/rpm-defines defines)
string(APPEND CPACK_RPM_SPEC_MORE_DEFINE "${defines}%define packager ${ORVPATCH_MAINTAINER}\n")

include(CPack)
