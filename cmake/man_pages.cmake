# korvsnmp_add_man_page(<page>): installs the man page <page> (mdoc or man
# source beside the calling CMakeLists.txt, its name ending in .<section>)
# gzipped into man<section>, in the package korvsnmp-tools, and hands it to
# the man page test (mandoc -T lint).
function(korvsnmp_add_man_page page)
  get_filename_component(name ${page} NAME)
  string(REGEX REPLACE "^.*\\.([1-9])$" "\\1" section ${name})
  set(source ${CMAKE_CURRENT_SOURCE_DIR}/${page})
  set(compressed ${CMAKE_CURRENT_BINARY_DIR}/${name}.gz)
  add_custom_command(OUTPUT ${compressed}
    COMMAND gzip -9 -n -c ${source} > ${compressed}
    DEPENDS ${source})
  add_custom_target(man_${name} ALL DEPENDS ${compressed})
  install(FILES ${compressed} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT tools)
  set_property(GLOBAL APPEND PROPERTY KORVSNMP_MAN_PAGES ${source})
endfunction()
