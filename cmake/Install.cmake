# SPDX-License-Identifier: Apache-2.0
# What is installed, and the Debian package of it (cpack -G DEB).
include(CMakePackageConfigHelpers)

set(keelgate_package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/Keelgate)

install(TARGETS keelgate RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
install(TARGETS VespKeelgateService RUNTIME DESTINATION ${CMAKE_INSTALL_LIBEXECDIR}/keelgate)

# The client: headers, library, and the two ways to find them. It needs nothing but the C++ library.
install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/keelgate DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}
  FILES_MATCHING PATTERN *.h)
set_target_properties(keelgate_client PROPERTIES EXPORT_NAME Client)
set_target_properties(keelgate_headers PROPERTIES EXPORT_NAME Headers)
install(TARGETS keelgate_client keelgate_headers EXPORT KeelgateTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(EXPORT KeelgateTargets NAMESPACE Keelgate:: DESTINATION ${keelgate_package_dir})
configure_package_config_file(${PROJECT_SOURCE_DIR}/packaging/KeelgateConfig.cmake.in
  ${CMAKE_BINARY_DIR}/KeelgateConfig.cmake INSTALL_DESTINATION ${keelgate_package_dir})
write_basic_package_version_file(${CMAKE_BINARY_DIR}/KeelgateConfigVersion.cmake
  COMPATIBILITY SameMinorVersion)
install(FILES ${CMAKE_BINARY_DIR}/KeelgateConfig.cmake
  ${CMAKE_BINARY_DIR}/KeelgateConfigVersion.cmake DESTINATION ${keelgate_package_dir})
# These name the prefix, which is known for sure only when it is installed: a package has another.
function(install_naming_prefix template destination)
  get_filename_component(name ${template} NAME_WLE)
  install(CODE "
    set(libdir \"${CMAKE_INSTALL_LIBDIR}\")
    set(libexecdir \"${CMAKE_INSTALL_LIBEXECDIR}\")
    set(PROJECT_VERSION \"${PROJECT_VERSION}\")
    set(PROJECT_DESCRIPTION \"${PROJECT_DESCRIPTION}\")
    configure_file(\"${PROJECT_SOURCE_DIR}/packaging/${template}\" \"${CMAKE_BINARY_DIR}/${name}\" @ONLY)
    file(INSTALL \"${CMAKE_BINARY_DIR}/${name}\" DESTINATION \"\${CMAKE_INSTALL_PREFIX}/${destination}\")")
endfunction()
install_naming_prefix(keelgate.pc.in ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
install_naming_prefix(systemd/keelgate@.service.in lib/systemd/system)

# For people and for init.
install(FILES ${PROJECT_SOURCE_DIR}/docs/man/keelgate.1 DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)
install(FILES ${PROJECT_SOURCE_DIR}/docs/man/VespKeelgateService.8
  DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
install(FILES ${PROJECT_SOURCE_DIR}/cli/keelgate.bash
  DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions RENAME keelgate)
install(FILES ${PROJECT_SOURCE_DIR}/cli/_keelgate
  DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions)
install(FILES ${PROJECT_SOURCE_DIR}/cli/keelgate.fish
  DESTINATION ${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d)
install(FILES ${PROJECT_SOURCE_DIR}/README.md ${PROJECT_SOURCE_DIR}/CHANGELOG.md
  DESTINATION ${CMAKE_INSTALL_DOCDIR})
install(FILES ${PROJECT_SOURCE_DIR}/packaging/copyright DESTINATION ${CMAKE_INSTALL_DOCDIR})
install(FILES ${PROJECT_SOURCE_DIR}/packaging/systemd/keelgate.socket
  DESTINATION lib/systemd/system)

set(CPACK_PACKAGE_NAME keelgate)
set(CPACK_PACKAGE_CONTACT "The Keelgate authors <keelgate@example.org>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${PROJECT_DESCRIPTION}")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_RECOMMENDS bash-completion)
include(CPack)
