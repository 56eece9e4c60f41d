# SPDX-License-Identifier: Apache-2.0
# Manual pages, made from docs/reference by pandoc, and completions; both are installed with the program that they are for.
install(FILES ${PROJECT_SOURCE_DIR}/packaging/completions/veltractl.bash RENAME veltractl
        DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions COMPONENT tools)
install(FILES ${PROJECT_SOURCE_DIR}/packaging/completions/_veltractl
        DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions COMPONENT tools)
install(FILES ${PROJECT_SOURCE_DIR}/packaging/completions/veltractl.fish
        DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d COMPONENT tools)

find_program(VELTRA_PANDOC pandoc)
if(NOT VELTRA_PANDOC)
  message(STATUS "pandoc is missing: no manual pages are made or installed")
  return()
endif()

# veltra_manual_pages(COMPONENT NAME.SECTION…)
function(veltra_manual_pages component)
  foreach(page ${ARGN})
    string(REGEX REPLACE ".*\\." "" section ${page})
    set(source ${PROJECT_SOURCE_DIR}/docs/reference/${page}.md)
    set(made ${PROJECT_BINARY_DIR}/man/${page})
    set(filter ${PROJECT_SOURCE_DIR}/packaging/man.lua)
    add_custom_command(OUTPUT ${made} DEPENDS ${source} ${filter}
      COMMAND ${VELTRA_PANDOC} --from gfm --to man --standalone --shift-heading-level-by=-1 --lua-filter ${filter}
              --metadata hyphenate=false --variable adjusting=l
              --metadata "footer=veltrad ${PROJECT_VERSION}" --output ${made} ${source}
      VERBATIM)
    set_property(GLOBAL APPEND PROPERTY VELTRA_MANUAL_PAGES ${made})
    install(FILES ${made} DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT ${component})
  endforeach()
endfunction()

file(MAKE_DIRECTORY ${PROJECT_BINARY_DIR}/man)
veltra_manual_pages(daemon veltrad.8 veltrad.5)
veltra_manual_pages(tools veltractl.1 veltra-storebag.1 veltra-storebag.5 veltra-storebag.7)
veltra_manual_pages(development libveltra.3 libveltra-testing.3)
if(VELTRA_LAB)
  veltra_manual_pages(lab veltra-lab.1)
endif()
if(VELTRA_GATEWAY)
  veltra_manual_pages(gateway veltra-gateway.1)
endif()
get_property(pages GLOBAL PROPERTY VELTRA_MANUAL_PAGES)
add_custom_target(manual_pages ALL DEPENDS ${pages})
