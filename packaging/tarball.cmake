# Run by cpack to make the .tar.gz of the staged files, and one of the debug symbols.

# orvpatch_tarball(FOLDER NAME): sorted and owned by root; all members have the time of SOURCE_DATE_EPOCH, if set.
function(orvpatch_tarball folder name)
  if(DEFINED ENV{SOURCE_DATE_EPOCH})
    set(time --mtime=@$ENV{SOURCE_DATE_EPOCH})
  endif()
  set(tarball ${CPACK_PACKAGE_DIRECTORY}/${name}.tar.gz)
  execute_process(
    COMMAND tar -C ${folder} --sort=name --owner=0 --group=0 --numeric-owner --mode=u=rwX,go=rX ${time}
            --transform=s,^\\.,${name}, -cf - .
    COMMAND gzip -9n
    OUTPUT_FILE ${tarball} COMMAND_ERROR_IS_FATAL ANY)
  set(CPACK_EXTERNAL_BUILT_PACKAGES ${CPACK_EXTERNAL_BUILT_PACKAGES} ${tarball} PARENT_SCOPE)
endfunction()

list(GET CPACK_BUILD_SOURCE_DIRS 1 build)
set(symbols ${build}/debug-symbols)
file(REMOVE_RECURSE ${symbols})
execute_process(
  COMMAND ${CMAKE_CURRENT_LIST_DIR}/debug-symbols ${CPACK_ORVPATCH_OBJCOPY} ${CPACK_ORVPATCH_READELF}
          ${build}/${CPACK_ORVPATCH_PROGRAM} ${symbols}
  COMMAND_ERROR_IS_FATAL ANY)
orvpatch_tarball(${symbols} ${CPACK_PACKAGE_FILE_NAME}-debug)
orvpatch_tarball(${CPACK_TEMPORARY_DIRECTORY} ${CPACK_PACKAGE_FILE_NAME})
