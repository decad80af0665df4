# kova_add_man_pages(<target> <page>...)
#
# Makes and installs the manual pages man/<page>.scd of the calling folder, for example
# "kovabackup.1". Without scdoc there are none.
find_program(KOVA_SCDOC scdoc)

function(kova_add_man_pages target)
  if(NOT KOVA_SCDOC)
    return()
  endif()
  set(pages)
  foreach(page IN LISTS ARGN)
    set(source ${CMAKE_CURRENT_SOURCE_DIR}/man/${page}.scd)
    set(made ${CMAKE_CURRENT_BINARY_DIR}/${page})
    # .TH turns hyphenation on again, which breaks the names of options and files.
    add_custom_command(OUTPUT ${made}
                       COMMAND ${KOVA_SCDOC} < ${source} > ${made}.roff
                       COMMAND sed "/^\\.TH /a .nh" ${made}.roff > ${made}
                       DEPENDS ${source} VERBATIM)
    string(REGEX MATCH "[0-9]$" section ${page})
    install(FILES ${made} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section})
    list(APPEND pages ${made})
  endforeach()
  add_custom_target(${target} ALL DEPENDS ${pages})
endfunction()
