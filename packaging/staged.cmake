# Run by cpack when the files of a package stand in their places.

set(staged ${CPACK_TEMPORARY_DIRECTORY})
file(GLOB program ${staged}/sbin/* ${staged}/usr/sbin/*)
execute_process(
  COMMAND ${CPACK_ORVPATCH_STRIP} --strip-all --remove-section=.comment --preserve-dates ${program}
  COMMAND_ERROR_IS_FATAL ANY)

# Independent of the umask of the build.
execute_process(COMMAND chmod -R u=rwX,go=rX ${staged} COMMAND_ERROR_IS_FATAL ANY)

# With SOURCE_DATE_EPOCH all get that time, so that it does not matter when a checkout was made.
if(DEFINED ENV{SOURCE_DATE_EPOCH})
  execute_process(COMMAND find ${staged} -exec touch -h -d @$ENV{SOURCE_DATE_EPOCH} {} +
    COMMAND_ERROR_IS_FATAL ANY)
endif()
