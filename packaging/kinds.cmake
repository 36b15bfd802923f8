# Read by cpack before each kind of package of CPACK_ORVPATCH_PROGRAM. A kind takes the files that go everywhere and its
# own ones.

set(program ${CPACK_ORVPATCH_PROGRAM})
set(version ${CPACK_PACKAGE_VERSION})
list(GET CPACK_BUILD_SOURCE_DIRS 0 source)
list(GET CPACK_BUILD_SOURCE_DIRS 1 build)

# What they run: ps by the name of its package on either family of RPM systems, since other makes of it lack -p; su is
# in util-linux there. On Debian tar, grep, su and sh are in packages that every system has, which are not named in
# dependencies.
file(READ ${build}/${program}.libc-level libc_level)
string(STRIP ${libc_level} libc_level)
set(debian_depends "libc6 (>= ${libc_level})")
set(rpm_requires "(procps-ng or procps), tar, grep, util-linux")
if(program STREQUAL orvpatch)
  set(everywhere program)
  set(site site)
  set(debian debian)
  set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "patch installer of the ORV monitoring product")
else()
  set(everywhere ctl)
  set(site ctl-site)
  set(debian ctl-debian)
  set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "patch maker and checker of the ORV monitoring product")
  # The installer of the same release: what is told of a patch comes from units that both share.
  # libarchive 3.3.3 is the first one with all functions that are called; RPM systems find it by the library's name.
  string(APPEND debian_depends ", libarchive13 (>= 3.3.3), orvpatch (= ${version}-1)")
  string(APPEND rpm_requires ", orvpatch = ${version}")
  set(CPACK_DEBIAN_PACKAGE_SOURCE orvpatch)
  set(CPACK_DEBIAN_PACKAGE_RECOMMENDS gpgv)
  set(CPACK_DEBIAN_PACKAGE_SUGGESTS gpg)
  # gpgv is in the package of gpg there.
  string(APPEND CPACK_RPM_SPEC_MORE_DEFINE "Recommends: (gnupg2 or gpg2)\n")
endif()

set(CPACK_PACKAGE_NAME ${program})
set(CPACK_PACKAGE_FILE_NAME ${program}-${version}-linux-${CPACK_ORVPATCH_PROCESSOR})
set(CPACK_PACKAGE_DESCRIPTION_FILE ${source}/packaging/${program}.description)
set(CPACK_DEBIAN_PACKAGE_DEPENDS "${debian_depends}, procps")
string(REGEX REPLACE "^p" "P" CPACK_RPM_PACKAGE_SUMMARY ${CPACK_PACKAGE_DESCRIPTION_SUMMARY})
set(CPACK_RPM_PACKAGE_REQUIRES "${rpm_requires}")

set(own ${site})
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
if(CPACK_GENERATOR STREQUAL DEB)
  set(own ${debian})
elseif(CPACK_GENERATOR STREQUAL External)
  # To be unpacked below any prefix.
  set(CPACK_PACKAGING_INSTALL_PREFIX /)
endif()
set(CPACK_INSTALL_CMAKE_PROJECTS "${build};orvpatch;${everywhere};/;${build};orvpatch;${own};/")
