# Man pages, each from the source docs/man/NAME.SECTION.scd, and what every package has in its folder of /usr/share/doc.
# They are part of the target `all`, which ./demo doesn't build. Without scdoc there are no man pages.

file(MAKE_DIRECTORY ${CMAKE_CURRENT_BINARY_DIR}/documents)
find_program(SCDOC scdoc)
set(documents)
file(GLOB pages CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/docs/man/*.scd)
foreach(page ${pages})
  if(SCDOC)
    get_filename_component(name ${page} NAME_WLE)
    string(REGEX MATCH "[0-9]$" section ${name})
    set(file ${CMAKE_CURRENT_BINARY_DIR}/documents/${name}.gz)
    add_custom_command(OUTPUT ${file} COMMAND ${SCDOC} < ${page} | gzip -9n > ${file} DEPENDS ${page})
    list(APPEND documents ${file})
    set(component tavrind)
    if(name MATCHES "^tavrin-(devserver|replay)")
      set(component tavrin-devtools)
    endif()
    install(FILES ${file} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT ${component})
  endif()
endforeach()

set(changelog ${CMAKE_CURRENT_BINARY_DIR}/documents/changelog.gz)
add_custom_command(OUTPUT ${changelog} COMMAND gzip -9n < ${PROJECT_SOURCE_DIR}/CHANGELOG > ${changelog}
                   DEPENDS ${PROJECT_SOURCE_DIR}/CHANGELOG)
foreach(package ${PACKAGES})
  install(FILES ${changelog} copyright DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/${package} COMPONENT ${package})
endforeach()
add_custom_target(documents ALL DEPENDS ${documents} ${changelog})
