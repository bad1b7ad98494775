# SPDX-License-Identifier: Apache-2.0
# cmake --preset package && cmake --build --preset package
# cpack --config build/package/CPackConfig.cmake
set(policy ${PROJECT_SOURCE_DIR}/packaging/debian)

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME keelgate)
set(CPACK_PACKAGE_CONTACT "The Keelgate authors <keelgate@example.org>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL service library development python)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
# What policy wants of the files, and that the tools are there which find the dependencies.
set(CPACK_PRE_BUILD_SCRIPTS ${policy}/stage.cmake)
set(CPACK_KEELGATE_SOURCE ${PROJECT_SOURCE_DIR})
set(CPACK_KEELGATE_LIBDIR ${CMAKE_INSTALL_FULL_LIBDIR})

# Library and service of different versions do not talk to each other.
set(same "(= ${PROJECT_VERSION})")
foreach(part "service keelgate utils" "library libkeelgate0 libs"
    "development libkeelgate-dev libdevel" "python python3-keelgate python")
  separate_arguments(part)
  list(GET part 0 component)
  list(GET part 1 package)
  list(GET part 2 section)
  string(TOUPPER ${component} PART)
  set(CPACK_DEBIAN_${PART}_PACKAGE_NAME ${package})
  set(CPACK_DEBIAN_${PART}_PACKAGE_SECTION ${section})
  file(READ ${policy}/${package}.description CPACK_COMPONENT_${PART}_DESCRIPTION)
endforeach()
set(CPACK_DEBIAN_SERVICE_PACKAGE_RECOMMENDS bash-completion)
set(CPACK_DEBIAN_LIBRARY_PACKAGE_DEPENDS "keelgate ${same}")
file(WRITE ${PROJECT_BINARY_DIR}/shlibs "libkeelgate 0 libkeelgate0 ${same}\n")
set(CPACK_DEBIAN_LIBRARY_PACKAGE_CONTROL_EXTRA ${PROJECT_BINARY_DIR}/shlibs ${policy}/triggers)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libkeelgate0 ${same}")
set(CPACK_DEBIAN_PYTHON_PACKAGE_ARCHITECTURE all)
set(CPACK_DEBIAN_PYTHON_PACKAGE_DEPENDS "python3 (>= 3.9), libkeelgate0 ${same}")
set(CPACK_DEBIAN_SERVICE_PACKAGE_CONTROL_EXTRA ${policy}/postinst ${policy}/prerm ${policy}/postrm)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
include(CPack)
