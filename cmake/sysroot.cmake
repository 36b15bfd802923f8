# Builds with the libraries that packaging/sysroot unpacks in place of those that the compiler would find by itself,
# and runs the result with them where an emulator is needed.

# orvpatch_sysroot(PRESET TRIPLET): for a toolchain file; sets ORVPATCH_SYSROOT to the folder.
function(orvpatch_sysroot preset triplet)
  execute_process(COMMAND ${CMAKE_CURRENT_FUNCTION_LIST_DIR}/../packaging/sysroot ${preset}
    OUTPUT_VARIABLE sysroot OUTPUT_STRIP_TRAILING_WHITESPACE RESULT_VARIABLE failed)
  if(failed)
    message(FATAL_ERROR "The libraries that ${preset} is built with cannot be had; the reason is told above.")
  endif()
  # The compiler's own headers, which belong to it and not to a library, stay.
  execute_process(COMMAND ${CMAKE_CXX_COMPILER} -print-file-name=include
    OUTPUT_VARIABLE compiler_headers OUTPUT_STRIP_TRAILING_WHITESPACE COMMAND_ERROR_IS_FATAL ANY)
  set(headers ${sysroot}/usr/${triplet}/include)
  # -B: start files and libraries are looked for there first. --sysroot: so are those that libc.so names.
  # The old library's std::function::swap reads what it has not set, so that the compiler warns.
  # In debug symbols the libraries lie where they do by default, wherever they were unpacked to.
  set(compile --sysroot=${sysroot} -ffile-prefix-map=${sysroot}=./build/sysroot/${preset}
    -Wno-uninitialized -Wno-maybe-uninitialized -nostdinc
    -isystem${headers}/c++/10 -isystem${headers}/c++/10/${triplet} -isystem${compiler_headers} -isystem${headers})
  # libarchive's own libraries are the host's.
  set(link --sysroot=${sysroot} -B${sysroot}/usr/lib/gcc-cross/${triplet}/10 -B${sysroot}/usr/${triplet}/lib
    -Wl,--allow-shlib-undefined)
  string(JOIN "\" \"" compile ${compile}) # quoted: the path may have blanks
  string(JOIN "\" \"" link ${link})
  # Set at each configuration, not only at the first: another list of packages may bring other flags.
  set(CMAKE_C_FLAGS "\"--sysroot=${sysroot}\"" PARENT_SCOPE)
  set(CMAKE_CXX_FLAGS "\"${compile}\"" PARENT_SCOPE)
  set(CMAKE_EXE_LINKER_FLAGS "\"${link}\"" PARENT_SCOPE)
  set(ORVPATCH_SYSROOT ${sysroot} PARENT_SCOPE)

  # The libraries of orvpatchctl: headers, and the shared library of the processor, which need not be that of the
  # package with the headers.
  set(CMAKE_FIND_ROOT_PATH ${CMAKE_FIND_ROOT_PATH} ${sysroot} PARENT_SCOPE)
  set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY PARENT_SCOPE)
  set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY PARENT_SCOPE)
  set(LibArchive_INCLUDE_DIR ${sysroot}/usr/include CACHE PATH "Headers of libarchive" FORCE)
  set(LibArchive_LIBRARY ${sysroot}/usr/lib/${triplet}/libarchive.so.13 CACHE FILEPATH "libarchive" FORCE)
endfunction()
