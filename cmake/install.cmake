# cmake --install: the library with its SONAME link, the stand-in platform
# library, the exported and platform headers, a pkg-config file and a CMake
# package (find_package(korvsnmp) gives korvsnmp::korvsnmp).
include(CMakePackageConfigHelpers)

set(korvsnmp_cmake_dir ${CMAKE_INSTALL_LIBDIR}/cmake/korvsnmp)

# Components (packages, cmake/packaging.cmake): the shared objects in
# `library`, everything a consumer builds with in `development`. The
# stand-in's test controls (platform/standin/korv_standin.h) stay out.
install(TARGETS korvsnmp korvplatform korvplatform_headers EXPORT korvsnmpTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library
          NAMELINK_COMPONENT development
  RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT library)
install(DIRECTORY include/korvsnmp DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT development)
file(GLOB korvplatform_headers_files ${PROJECT_SOURCE_DIR}/platform/korv_*.h)
install(FILES ${korvplatform_headers_files} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/korvplatform
  COMPONENT development)

install(EXPORT korvsnmpTargets NAMESPACE korvsnmp:: DESTINATION ${korvsnmp_cmake_dir}
  COMPONENT development)
configure_package_config_file(cmake/korvsnmpConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/korvsnmpConfig.cmake INSTALL_DESTINATION ${korvsnmp_cmake_dir})
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/korvsnmpConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/korvsnmpConfig.cmake
              ${CMAKE_CURRENT_BINARY_DIR}/korvsnmpConfigVersion.cmake
  DESTINATION ${korvsnmp_cmake_dir} COMPONENT development)

# The pkg-config file finds its prefix from its own place, so that the tree
# may be installed with any --prefix.
file(RELATIVE_PATH korvsnmp_pc_to_prefix
  ${CMAKE_INSTALL_PREFIX}/${CMAKE_INSTALL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
configure_file(cmake/korvsnmp.pc.in ${CMAKE_CURRENT_BINARY_DIR}/korvsnmp.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/korvsnmp.pc
  DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
