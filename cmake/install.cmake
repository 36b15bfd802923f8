# What is installed, and where. Components: "program" goes everywhere; "site" and "debian" hold what the kinds of
# systems expect in different places.

include(GNUInstallDirs)

# orvpatch_compressed(VARIABLE SOURCE NAME): has a file compressed under a name as part of the build; -n keeps
# time and name of the source out of it.
function(orvpatch_compressed variable source name)
  set(compressed ${CMAKE_BINARY_DIR}/share/${name}.gz)
  add_custom_command(OUTPUT ${compressed}
    COMMAND ${CMAKE_COMMAND} -E make_directory ${CMAKE_BINARY_DIR}/share
    COMMAND gzip -9nc ${source} > ${compressed}
    DEPENDS ${source} VERBATIM)
  set(${variable} ${compressed} PARENT_SCOPE)
endfunction()

foreach(page orvpatch.8 patch.ini.5 orvpatch-archive.5 orv-registry.5 patches.hist.5)
  orvpatch_compressed(compressed ${CMAKE_SOURCE_DIR}/man/${page} ${page})
  list(APPEND shared_files ${compressed})
  string(REGEX REPLACE ".*\\." "" section ${page})
  install(FILES ${compressed} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT program)
endforeach()
# The log is described with the history; both names lead to the page.
file(CONFIGURE OUTPUT ${CMAKE_BINARY_DIR}/orvpatch.log.5 CONTENT ".so man5/patches.hist.5\n" @ONLY)
orvpatch_compressed(compressed ${CMAKE_BINARY_DIR}/orvpatch.log.5 orvpatch.log.5)
list(APPEND shared_files ${compressed})
install(FILES ${compressed} DESTINATION ${CMAKE_INSTALL_MANDIR}/man5 COMPONENT program)

install(TARGETS orvpatch RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR} COMPONENT program)
install(FILES completions/orvpatch.bash
  DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions RENAME orvpatch COMPONENT program)
install(FILES completions/orvpatch.fish
  DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d COMPONENT program)
install(FILES packaging/orvpatch.logrotate DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples COMPONENT program)

# The documents and their pictures, but for what only those who release need; what is linked and not installed
# becomes plain text.
file(GLOB documents RELATIVE ${CMAKE_SOURCE_DIR} CONFIGURE_DEPENDS README.md SECURITY.md docs/*.md docs/*.svg)
list(REMOVE_ITEM documents docs/release.md)
foreach(document ${documents})
  get_filename_component(folder ${document} DIRECTORY)
  if(document MATCHES "\\.svg$")
    install(FILES ${document} DESTINATION ${CMAKE_INSTALL_DOCDIR}/${folder} COMPONENT program)
    continue()
  endif()
  set(page ${CMAKE_BINARY_DIR}/share/doc/${document})
  add_custom_command(OUTPUT ${page}
    COMMAND ${CMAKE_COMMAND} -E make_directory ${CMAKE_BINARY_DIR}/share/doc/${folder}
    COMMAND ${CMAKE_SOURCE_DIR}/packaging/installed-page ${document} ${documents} > ${page}
    DEPENDS ${document} packaging/installed-page VERBATIM)
  list(APPEND shared_files ${page})
  install(FILES ${page} DESTINATION ${CMAKE_INSTALL_DOCDIR}/${folder} COMPONENT program)
endforeach()

install(FILES completions/_orvpatch
  DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/site-functions COMPONENT site)
install(FILES CHANGELOG.md packaging/copyright DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT site)

include(${CMAKE_CURRENT_LIST_DIR}/changelog.cmake)
orvpatch_compressed(changelog ${CMAKE_SOURCE_DIR}/CHANGELOG.md changelog)
orvpatch_compressed(changelog_debian ${CMAKE_BINARY_DIR}/changelog.Debian changelog.Debian)
list(APPEND shared_files ${changelog} ${changelog_debian})
install(FILES completions/_orvpatch
  DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions COMPONENT debian EXCLUDE_FROM_ALL)
install(FILES packaging/copyright ${changelog} ${changelog_debian}
  DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT debian EXCLUDE_FROM_ALL)
install(FILES packaging/orvpatch.lintian-overrides
  DESTINATION ${CMAKE_INSTALL_DATADIR}/lintian/overrides RENAME orvpatch COMPONENT debian EXCLUDE_FROM_ALL)

add_custom_target(shared_files ALL DEPENDS ${shared_files})

if(ORVPATCH_CTL)
  include(${CMAKE_CURRENT_LIST_DIR}/installctl.cmake)
endif()
