# SPDX-License-Identifier: Apache-2.0
# What is installed. Three parts, which are three packages in Debian: the command with its service,
# the shared library, and what it takes to build with it.
include(CMakePackageConfigHelpers)

set(keelgate_package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/Keelgate)
set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME service)

if(KEELGATE_COMMAND)
  install(TARGETS keelgate RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT service)
endif()
install(TARGETS VespKeelgateService RUNTIME
  DESTINATION ${CMAKE_INSTALL_LIBEXECDIR}/keelgate COMPONENT service)

# The client: headers, library, and the two ways to find them. It needs nothing but the C++ library.
install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}
  COMPONENT development FILES_MATCHING PATTERN *.h)
set_target_properties(keelgate_client PROPERTIES EXPORT_NAME Client)
set_target_properties(keelgate_headers PROPERTIES EXPORT_NAME Headers)
install(TARGETS keelgate_client keelgate_headers EXPORT KeelgateTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library NAMELINK_COMPONENT development
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT development
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(EXPORT KeelgateTargets NAMESPACE Keelgate:: DESTINATION ${keelgate_package_dir}
  COMPONENT development)
configure_package_config_file(${PROJECT_SOURCE_DIR}/packaging/KeelgateConfig.cmake.in
  ${PROJECT_BINARY_DIR}/KeelgateConfig.cmake INSTALL_DESTINATION ${keelgate_package_dir})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/KeelgateConfigVersion.cmake
  COMPATIBILITY SameMinorVersion)
install(FILES ${PROJECT_BINARY_DIR}/KeelgateConfig.cmake
  ${PROJECT_BINARY_DIR}/KeelgateConfigVersion.cmake DESTINATION ${keelgate_package_dir}
  COMPONENT development)
# Relative to itself, so that the tree can be moved.
file(RELATIVE_PATH from_pkgconfig ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
if(NOT BUILD_SHARED_LIBS)
  set(libraries_private "-lstdc++")
endif()
configure_file(${PROJECT_SOURCE_DIR}/packaging/keelgate.pc.in
  ${PROJECT_BINARY_DIR}/keelgate.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/keelgate.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig
  COMPONENT development)

# For init. The unit names the prefix, which is known for sure only when it is installed.
set(units lib/systemd/system)
install(CODE "
  set(libexecdir \"${CMAKE_INSTALL_LIBEXECDIR}\")
  configure_file(\"${PROJECT_SOURCE_DIR}/packaging/systemd/keelgate@.service.in\"
    \"${PROJECT_BINARY_DIR}/keelgate@.service\" @ONLY)
  file(INSTALL \"${PROJECT_BINARY_DIR}/keelgate@.service\"
    DESTINATION \"\${CMAKE_INSTALL_PREFIX}/${units}\")" COMPONENT service)
foreach(unit keelgate.socket keelgate@.socket keelgate.slice)
  install(FILES ${PROJECT_SOURCE_DIR}/packaging/systemd/${unit} DESTINATION ${units}
    COMPONENT service)
endforeach()
install(FILES ${PROJECT_SOURCE_DIR}/packaging/systemd/keelgate.sysusers
  DESTINATION lib/sysusers.d RENAME keelgate.conf COMPONENT service)

# For people.
install(FILES ${PROJECT_SOURCE_DIR}/cli/keelgate.bash
  DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions RENAME keelgate
  COMPONENT service)
install(FILES ${PROJECT_SOURCE_DIR}/cli/_keelgate
  DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions COMPONENT service)
install(FILES ${PROJECT_SOURCE_DIR}/cli/keelgate.fish
  DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d COMPONENT service)
install(FILES ${PROJECT_SOURCE_DIR}/docs/man/keelgate.1
  DESTINATION ${CMAKE_INSTALL_MANDIR}/man1 COMPONENT service)
install(FILES ${PROJECT_SOURCE_DIR}/docs/man/VespKeelgateService.8
  DESTINATION ${CMAKE_INSTALL_MANDIR}/man8 COMPONENT service)
file(GLOB pages ${PROJECT_SOURCE_DIR}/docs/*.md)
install(FILES ${pages} DESTINATION ${CMAKE_INSTALL_DOCDIR}/docs COMPONENT service)
install(FILES ${PROJECT_SOURCE_DIR}/README.md ${PROJECT_SOURCE_DIR}/SECURITY.md
  ${PROJECT_SOURCE_DIR}/LICENSE
  ${PROJECT_SOURCE_DIR}/CHANGELOG.md DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT service)
install(FILES ${PROJECT_SOURCE_DIR}/examples/unpack.cpp ${PROJECT_SOURCE_DIR}/examples/unpack.c
  ${PROJECT_SOURCE_DIR}/examples/unpack.py
  DESTINATION ${CMAKE_INSTALL_DOCDIR}/examples COMPONENT service)

if(PROJECT_IS_TOP_LEVEL)
  include(DebianPackages)
endif()
