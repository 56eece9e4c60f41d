# SPDX-License-Identifier: Apache-2.0
# The installation, by component: daemon, library, development, tools, lab, gateway, python. All paths are relative to the prefix,
# except that /usr has its configuration in /etc.
include(CMakePackageConfigHelpers)

set(UNIT_DIRECTORY lib/systemd/system)
set(PYTHON_DIRECTORY lib/python3/dist-packages)
set(CONFIG_DIRECTORY ${CMAKE_INSTALL_LIBDIR}/cmake/Veltra)
set(MADE ${PROJECT_BINARY_DIR}/install)

# veltra_install_unit(COMPONENT NAME): a unit, with the programs' place under the prefix, which is known at installation only.
function(veltra_install_unit component name)
  install(CODE "
    file(READ \"${PROJECT_SOURCE_DIR}/packaging/${name}\" text)
    string(REPLACE =/usr/libexec/ =\${CMAKE_INSTALL_PREFIX}/${CMAKE_INSTALL_LIBEXECDIR}/ text \"\${text}\")
    string(REPLACE =/usr/bin/ =\${CMAKE_INSTALL_PREFIX}/${CMAKE_INSTALL_BINDIR}/ text \"\${text}\")
    file(WRITE \"${MADE}/${name}\" \"\${text}\")
    file(INSTALL DESTINATION \"\${CMAKE_INSTALL_PREFIX}/${UNIT_DIRECTORY}\" TYPE FILE FILES \"${MADE}/${name}\")"
    COMPONENT ${component})
endfunction()

# veltra_install_configuration(COMPONENT FILE DIRECTORY NAME): a file below etc; the prefix is known at installation only.
function(veltra_install_configuration component file directory name)
  install(CODE "
    if(CMAKE_INSTALL_PREFIX STREQUAL \"/usr\")
      set(etc /etc)
    else()
      set(etc \${CMAKE_INSTALL_PREFIX}/etc)
    endif()
    file(INSTALL DESTINATION \"\${etc}/${directory}\" TYPE FILE RENAME ${name} FILES \"${file}\")"
    COMPONENT ${component})
endfunction()

# ---- The daemon ----
install(TARGETS veltrad RUNTIME DESTINATION ${CMAKE_INSTALL_LIBEXECDIR} COMPONENT daemon)
install(DIRECTORY DESTINATION ${CMAKE_INSTALL_DATADIR}/veltra COMPONENT daemon)  # the public key of storebags comes here
veltra_install_unit(daemon veltrad.service)
veltra_install_unit(daemon veltrad.socket)
install(FILES packaging/veltrad.sysusers DESTINATION lib/sysusers.d RENAME veltrad.conf COMPONENT daemon)
install(FILES packaging/veltrad.tmpfiles DESTINATION lib/tmpfiles.d RENAME veltrad.conf COMPONENT daemon)
veltra_install_configuration(daemon ${PROJECT_SOURCE_DIR}/packaging/veltrad.logrotate logrotate.d veltrad)

# ---- libveltra, libveltra-testing ----
install(TARGETS veltra EXPORT Veltra
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library NAMELINK_COMPONENT development
        INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(TARGETS veltra-testing EXPORT Veltra
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT development
        INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(DIRECTORY include/veltra DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT development)
file(RELATIVE_PATH UP_TO_PREFIX ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
string(REGEX REPLACE "/$" "" UP_TO_PREFIX "${UP_TO_PREFIX}")
foreach(name veltra veltra-testing)
  configure_file(cmake/${name}.pc.in ${MADE}/${name}.pc @ONLY)
  install(FILES ${MADE}/${name}.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
endforeach()
configure_package_config_file(cmake/VeltraConfig.cmake.in ${MADE}/VeltraConfig.cmake
                              INSTALL_DESTINATION ${CONFIG_DIRECTORY} NO_SET_AND_CHECK_MACRO)
write_basic_package_version_file(${MADE}/VeltraConfigVersion.cmake COMPATIBILITY SameMajorVersion)
install(FILES ${MADE}/VeltraConfig.cmake ${MADE}/VeltraConfigVersion.cmake DESTINATION ${CONFIG_DIRECTORY}
        COMPONENT development)
install(EXPORT Veltra FILE VeltraTargets.cmake NAMESPACE Veltra:: DESTINATION ${CONFIG_DIRECTORY} COMPONENT development)

# ---- Tools, lab, Python ----
install(TARGETS veltractl veltra-storebag RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT tools)
if(VELTRA_LAB)
  install(TARGETS veltra-lab RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT lab)
  veltra_install_unit(lab veltra-lab.service)
endif()
if(VELTRA_GATEWAY)
  install(TARGETS veltra-gateway RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT gateway)
  veltra_install_unit(gateway veltra-gateway.service)
  veltra_install_unit(gateway veltra-gateway-drain.service)
  install(FILES packaging/veltra-gateway.sysusers DESTINATION lib/sysusers.d RENAME veltra-gateway.conf COMPONENT gateway)
  install(FILES fleet/nginx.conf fleet/stream.conf fleet/postgresql.conf fleet/schema.sql fleet/column_store.sql fleet/README.md
          DESTINATION ${CMAKE_INSTALL_DATADIR}/veltra-gateway COMPONENT gateway)
endif()
install(DIRECTORY python/veltra DESTINATION ${PYTHON_DIRECTORY} COMPONENT python PATTERN __pycache__ EXCLUDE)
