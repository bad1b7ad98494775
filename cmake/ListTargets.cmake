# SPDX-License-Identifier: Apache-2.0
# Writes targets.txt, which the architecture test reads: for each target its name, folder, sources,
# what it links, and what those that link it get. One line each, fields separated by bars.

function(keelgate_list_targets folder)
  get_property(targets DIRECTORY ${folder} PROPERTY BUILDSYSTEM_TARGETS)
  foreach(target IN LISTS targets)
    get_target_property(type ${target} TYPE)
    if(type STREQUAL "UTILITY")
      continue()
    endif()
    set(line ${target}|${folder})
    foreach(property SOURCES LINK_LIBRARIES INTERFACE_LINK_LIBRARIES)
      get_property(value TARGET ${target} PROPERTY ${property})
      string(APPEND line "|${value}")
    endforeach()
    file(APPEND ${PROJECT_BINARY_DIR}/targets.txt "${line}\n")
  endforeach()
  get_property(folders DIRECTORY ${folder} PROPERTY SUBDIRECTORIES)
  foreach(below IN LISTS folders)
    keelgate_list_targets(${below})
  endforeach()
endfunction()

file(WRITE ${PROJECT_BINARY_DIR}/targets.txt "")
keelgate_list_targets(${PROJECT_SOURCE_DIR})
