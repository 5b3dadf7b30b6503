# Debian packages: `cpack -G DEB` in the build directory gives one package
# per install COMPONENT:
#   library     -> libkorvsnmp1     libkorvsnmp.so.1 and the platform library
#   development -> libkorvsnmp-dev  headers, the .so links, pkg-config, CMake package
#   tools       -> korvsnmp-tools   the programs, their man pages, systemd units
# Every install() rule names one of these components.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME korvsnmp)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_CONTACT "korvsnmp developers <korvsnmp@example.org>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL library development tools)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(KORVSNMP_DEBIAN_VERSION ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)

# Dependencies on other packages from dpkg-shlibdeps; on each other from the
# component dependencies (exact version). dpkg-shlibdeps finds our own
# libraries in the build tree.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_ENABLE_COMPONENT_DEPENDS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS
  ${PROJECT_BINARY_DIR} ${PROJECT_BINARY_DIR}/platform)

set(CPACK_DEBIAN_LIBRARY_PACKAGE_NAME libkorvsnmp1)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SECTION libs)
# ldconfig runs through a trigger; the scripts given here keep CPack from
# writing ones that call it.
set(CPACK_DEBIAN_LIBRARY_PACKAGE_CONTROL_EXTRA ${CMAKE_CURRENT_LIST_DIR}/debian/triggers
  ${CMAKE_CURRENT_LIST_DIR}/debian/postinst ${CMAKE_CURRENT_LIST_DIR}/debian/postrm)
set(CPACK_COMPONENT_LIBRARY_DESCRIPTION
  "NAS appliance statistics from the collector daemon (library)
libkorvsnmp gives the local processes of a network-attached storage
appliance, above all its SNMP agent, the appliance's current statistics:
CPU, memory, network interfaces, disks, volumes, iSCSI LUNs and NFS,
obtained from the collector daemon korvsnmpcd and named for users from the
host's configuration. This package holds the shared library and the host
platform library that it calls.")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libkorvsnmp-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_COMPONENT_DEVELOPMENT_DEPENDS library)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libjsoncpp-dev")
set(CPACK_COMPONENT_DEVELOPMENT_DESCRIPTION
  "NAS appliance statistics from the collector daemon (development files)
libkorvsnmp gives the local processes of a network-attached storage
appliance the appliance's current statistics from the collector daemon
korvsnmpcd. This package holds the headers of the library and of the host
platform, a pkg-config file and a CMake package (korvsnmp::korvsnmp).")

set(CPACK_DEBIAN_TOOLS_PACKAGE_NAME korvsnmp-tools)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SECTION admin)
# The snmpd module lies under /usr/lib, where CPack would call ldconfig from
# scripts of its own; these say there is nothing to do.
set(CPACK_DEBIAN_TOOLS_PACKAGE_CONTROL_EXTRA ${CMAKE_CURRENT_LIST_DIR}/debian/tools/postinst
  ${CMAKE_CURRENT_LIST_DIR}/debian/tools/postrm)
set(CPACK_COMPONENT_TOOLS_DEPENDS library)
set(CPACK_COMPONENT_TOOLS_DESCRIPTION
  "NAS appliance statistics from the collector daemon (programs)
The operators' programs of libkorvsnmp: korvsnmp-stat, which shows the
appliance's statistics as JSON, tables or OpenMetrics text, KORVSNMP-MIB
served by the SNMP AgentX subagent korvsnmp-agentx or inside snmpd by the
module korvsnmp-snmpd.so, the Prometheus exporter korvsnmp-exporter with
alerting rules, and the reference collector daemon korvsnmpcd, with their
manual pages and systemd units.")

# The installed programs find the libraries in /usr/lib: the packages carry
# no RPATH (the plain install keeps it, for any --prefix).
set(CPACK_PRE_BUILD_SCRIPTS ${CMAKE_CURRENT_LIST_DIR}/debian/remove_rpath.cmake)

# Each package's copyright, changelog and lintian overrides.
configure_file(${CMAKE_CURRENT_LIST_DIR}/debian/changelog.in
  ${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian @ONLY)
execute_process(COMMAND gzip -9 -n -f ${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian)
foreach(component library development tools)
  string(TOUPPER ${component} upper)
  set(package ${CPACK_DEBIAN_${upper}_PACKAGE_NAME})
  install(FILES ${CMAKE_CURRENT_LIST_DIR}/debian/copyright
                ${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian.gz
    DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/doc/${package} COMPONENT ${component})
  set(overrides ${CMAKE_CURRENT_LIST_DIR}/debian/${package}.lintian-overrides)
  if(EXISTS ${overrides})
    install(FILES ${overrides} DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/lintian/overrides
      RENAME ${package} COMPONENT ${component})
  endif()
endforeach()

include(CPack)
