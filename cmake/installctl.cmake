# What is installed of orvpatchctl, for a package of its own. Components: "ctl" goes everywhere, "ctl-site" and
# "ctl-debian" hold what the kinds of systems expect in different places.

set(ctl_doc ${CMAKE_INSTALL_DATAROOTDIR}/doc/orvpatchctl)

install(TARGETS orvpatchctl RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR} COMPONENT ctl)
orvpatch_compressed(ctl_page ${CMAKE_SOURCE_DIR}/man/orvpatchctl.8 orvpatchctl.8)
install(FILES ${ctl_page} DESTINATION ${CMAKE_INSTALL_MANDIR}/man8 COMPONENT ctl)
install(FILES completions/orvpatchctl.bash
  DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions RENAME orvpatchctl COMPONENT ctl)
install(FILES completions/orvpatchctl.fish
  DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d COMPONENT ctl)
file(GLOB schemas CONFIGURE_DEPENDS docs/schema/*.json)
install(FILES ${schemas} DESTINATION ${ctl_doc}/schema COMPONENT ctl)
# Their licences ask for it: the code of the two header libraries is in the program.
foreach(library libcli11-dev nlohmann-json3-dev)
  install(FILES ${ORVPATCH_SYSROOT}/usr/share/doc/${library}/copyright
    DESTINATION ${ctl_doc}/notices RENAME ${library} COMPONENT ctl)
endforeach()

install(FILES completions/_orvpatchctl
  DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/site-functions COMPONENT ctl-site)
install(FILES CHANGELOG.md packaging/copyright DESTINATION ${ctl_doc} COMPONENT ctl-site)

install(FILES completions/_orvpatchctl
  DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions COMPONENT ctl-debian EXCLUDE_FROM_ALL)
install(FILES packaging/copyright ${changelog} ${changelog_debian}
  DESTINATION ${ctl_doc} COMPONENT ctl-debian EXCLUDE_FROM_ALL)
install(FILES packaging/orvpatchctl.lintian-overrides
  DESTINATION ${CMAKE_INSTALL_DATADIR}/lintian/overrides RENAME orvpatchctl COMPONENT ctl-debian EXCLUDE_FROM_ALL)

add_custom_target(ctl_files ALL DEPENDS ${ctl_page})
