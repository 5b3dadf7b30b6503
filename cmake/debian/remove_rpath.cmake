# CPack pre-build script: the packaged programs and libraries lose the
# RPATH that the plain install gives them.
file(GLOB_RECURSE staged LIST_DIRECTORIES false ${CPACK_TEMPORARY_INSTALL_DIRECTORY}/*)
foreach(file IN LISTS staged)
  if(NOT IS_SYMLINK ${file} AND file MATCHES "/(bin|sbin)/[^/]+$|/lib/[^/]+\\.so[.0-9]*$|/korvsnmp/[^/]+\\.so$")
    file(RPATH_REMOVE FILE ${file})
  endif()
endforeach()
