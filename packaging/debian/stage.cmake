# SPDX-License-Identifier: Apache-2.0
# Run by CPack on what was installed for the packages, before they are made.
cmake_minimum_required(VERSION 3.25)

# CPack makes packages without dependencies where it does not find these.
find_program(shlibdeps dpkg-shlibdeps)
if(NOT shlibdeps)
  message(FATAL_ERROR "dpkg-shlibdeps is missing, which finds the packages' dependencies: "
    "install dpkg-dev")
endif()
if(NOT CPACK_KEELGATE_LIBDIR MATCHES "^/usr/lib/.+-")
  message(FATAL_ERROR "The build is configured for ${CPACK_KEELGATE_LIBDIR}, and Debian's "
    "libraries are below /usr/lib: configure it with the preset package")
endif()

set(policy ${CMAKE_CURRENT_LIST_DIR})
set(stage ${CPACK_TEMPORARY_INSTALL_DIRECTORY})
string(TIMESTAMP date "%a, %d %b %Y %H:%M:%S +0000" UTC)
foreach(part "service keelgate" "library libkeelgate0" "development libkeelgate-dev"
    "python python3-keelgate")
  separate_arguments(part)
  list(GET part 0 component)
  list(GET part 1 package)
  set(usr ${stage}/${component}/usr)
  set(doc ${usr}/share/doc/${package})
  file(COPY ${policy}/../copyright DESTINATION ${doc})
  file(WRITE ${doc}/changelog "keelgate (${CPACK_PACKAGE_VERSION}) unstable; urgency=medium\n\n"
    "  * See CHANGELOG.md.\n\n -- ${CPACK_PACKAGE_CONTACT}  ${date}\n")
  file(GLOB pages ${usr}/share/man/man*/*)
  execute_process(COMMAND gzip -9n ${doc}/changelog ${pages} COMMAND_ERROR_IS_FATAL ANY)
  if(EXISTS ${policy}/${package}.lintian-overrides)
    file(COPY_FILE ${policy}/${package}.lintian-overrides ${usr}/${package})
    file(MAKE_DIRECTORY ${usr}/share/lintian/overrides)
    file(RENAME ${usr}/${package} ${usr}/share/lintian/overrides/${package})
  endif()
endforeach()
# Debian has its own copy of it.
file(REMOVE ${stage}/service/usr/share/doc/keelgate/LICENSE)
