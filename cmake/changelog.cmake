# The change logs that the package formats ask for, made of the newest entry of CHANGELOG.md. Its release must
# be the one that is built, or the one that a build between two releases leads to.

set(ORVPATCH_PACKAGE_VERSION ${PROJECT_VERSION} CACHE STRING "Version of the packages: see packaging/version")

file(STRINGS ${CMAKE_SOURCE_DIR}/CHANGELOG.md headings REGEX "^## ")
list(GET headings 0 newest)
if(NOT newest MATCHES "^## ${PROJECT_VERSION} \\((....-..-..)\\)$")
  message(FATAL_ERROR "CHANGELOG.md begins with \"${newest}\" in place of \"## ${PROJECT_VERSION} (YYYY-MM-DD)\"")
endif()
set(release_day ${CMAKE_MATCH_1})

function(orvpatch_release_date variable format)
  execute_process(COMMAND ${CMAKE_COMMAND} -E env LC_ALL=C date -u -d ${release_day} +${format}
    OUTPUT_VARIABLE text OUTPUT_STRIP_TRAILING_WHITESPACE COMMAND_ERROR_IS_FATAL ANY)
  set(${variable} ${text} PARENT_SCOPE)
endfunction()

set(ORVPATCH_MAINTAINER "orvpatch maintainers <orvpatch@norvik.example>")
orvpatch_release_date(debian_date "%a, %d %b %Y %T +0000")
file(CONFIGURE OUTPUT ${CMAKE_BINARY_DIR}/changelog.Debian @ONLY CONTENT
"orvpatch (@ORVPATCH_PACKAGE_VERSION@-1) stable; urgency=medium

  * Release @ORVPATCH_PACKAGE_VERSION@; changelog.gz tells what is new.

 -- @ORVPATCH_MAINTAINER@  @debian_date@
")
orvpatch_release_date(rpm_date "%a %b %d %Y")
file(CONFIGURE OUTPUT ${CMAKE_BINARY_DIR}/changelog.rpm @ONLY CONTENT
"* @rpm_date@ @ORVPATCH_MAINTAINER@ - @ORVPATCH_PACKAGE_VERSION@-1
- Release @ORVPATCH_PACKAGE_VERSION@; CHANGELOG.md tells what is new.
")
