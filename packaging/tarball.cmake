# Run by cpack to make the .tar.gz of the staged files: sorted, and owned by root whoever makes it.

get_filename_component(top ${CPACK_TEMPORARY_DIRECTORY} DIRECTORY)
set(tarball ${CPACK_PACKAGE_DIRECTORY}/${CPACK_PACKAGE_FILE_NAME}.tar.gz)
execute_process(
  COMMAND tar -C ${CPACK_TEMPORARY_DIRECTORY} --sort=name --owner=0 --group=0 --numeric-owner
          --transform=s,^\\.,${CPACK_PACKAGE_FILE_NAME}, -cf - .
  COMMAND gzip -9n
  OUTPUT_FILE ${tarball} COMMAND_ERROR_IS_FATAL ANY)
set(CPACK_EXTERNAL_BUILT_PACKAGES ${tarball})
