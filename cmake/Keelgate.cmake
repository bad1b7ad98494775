# SPDX-License-Identifier: Apache-2.0
# What every target shares: the language, the warnings, where programs land, and how tests join.

include(GNUInstallDirs)

if(NOT CMAKE_BUILD_TYPE AND PROJECT_IS_TOP_LEVEL)
  set(CMAKE_BUILD_TYPE Release CACHE STRING "" FORCE)
endif()

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
set(CMAKE_RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/bin)
set(CMAKE_LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/lib)
set(CMAKE_ARCHIVE_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/lib)

# Whether a warning is an error is for the presets to say (CMAKE_COMPILE_WARNING_AS_ERROR).
add_compile_options(-Wall -Wextra -Wpedantic -Wconversion)
add_compile_options(-fstack-protector-strong)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  add_compile_options(-Werror=missing-field-initializers)
  # g++ 12 sees an overlap in "literal" + std::string when it optimises (its bug 105651).
  add_compile_options(-Wno-restrict)
  # g++ 14 takes what a vector appends for outside of it when it optimises; clang does not.
  if(CMAKE_CXX_COMPILER_VERSION VERSION_GREATER_EQUAL 13)
    add_compile_options(-Wno-array-bounds)
  endif()
else()
  add_compile_options(-Werror=reorder-init-list)
endif()
if(CMAKE_BUILD_TYPE STREQUAL "Debug")
  add_compile_definitions(_GLIBCXX_ASSERTIONS)
else()
  # Bounds checks of the standard library stay on where hostile bytes are read: they cost little
  # beside what an unchecked index can cost.
  add_compile_definitions(_GLIBCXX_ASSERTIONS)
  # A distribution has its own level.
  if(NOT CMAKE_CXX_FLAGS MATCHES "_FORTIFY_SOURCE")
    add_compile_definitions(_FORTIFY_SOURCE=2)
  endif()
endif()

add_link_options(-Wl,-z,relro,-z,now)

if(KEELGATE_SANITIZE)
  add_compile_options(-fsanitize=${KEELGATE_SANITIZE} -fno-sanitize-recover=all)
  # By them it finds who allocated.
  add_compile_options(-fno-omit-frame-pointer)
  add_link_options(-fsanitize=${KEELGATE_SANITIZE})
  # The seal kills what a sanitizer's runtime needs, so such a build is made without it.
  add_compile_definitions(KEELGATE_UNSEALED)
endif()
if(KEELGATE_FUZZ)
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()

if(KEELGATE_TESTS)
  enable_testing()
  find_package(GTest REQUIRED)
  include(GoogleTest)
endif()

# keelgate_library(NAME SOURCES ... [PUBLIC libs...] [PRIVATE libs...])
# A module of the tree: the target keelgate_NAME, which others link as Keelgate::NAME. Headers are
# included by their path from the root; the architecture test fails where a file includes from a
# module that its target does not link, and where a link is not used.
function(keelgate_library name)
  cmake_parse_arguments(arg "" "" "SOURCES;PUBLIC;PRIVATE" ${ARGN})
  add_library(keelgate_${name} STATIC ${arg_SOURCES})
  add_library(Keelgate::${name} ALIAS keelgate_${name})
  target_include_directories(keelgate_${name}
    PUBLIC ${PROJECT_SOURCE_DIR} ${PROJECT_SOURCE_DIR}/include)
  target_link_libraries(keelgate_${name} PUBLIC ${arg_PUBLIC} PRIVATE ${arg_PRIVATE})
endfunction()

# keelgate_test(NAME SOURCES ... LIBRARIES ...): one test program for a module.
function(keelgate_test name)
  if(NOT KEELGATE_TESTS)
    return()
  endif()
  cmake_parse_arguments(arg "" "TIMEOUT" "SOURCES;LIBRARIES" ${ARGN})
  if(NOT arg_TIMEOUT)
    set(arg_TIMEOUT 300)
  endif()
  # In an emulator of processes.
  if(CMAKE_CROSSCOMPILING)
    math(EXPR arg_TIMEOUT "5 * ${arg_TIMEOUT}")
  endif()
  add_executable(${name} ${arg_SOURCES})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR} ${PROJECT_SOURCE_DIR}/include)
  target_link_libraries(${name} PRIVATE ${arg_LIBRARIES} GTest::gtest_main)
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    # g++ 12 takes the temporaries of a table of rows for uninitialised when it optimises.
    target_compile_options(${name} PRIVATE -Wno-maybe-uninitialized)
  endif()
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/tests)
  add_test(NAME ${name} COMMAND ${name})
  set_tests_properties(${name} PROPERTIES TIMEOUT ${arg_TIMEOUT})
endfunction()

# keelgate_service(NAME SOURCES ... LIBRARIES ...): a program that ends in KeelgateServer::resume.
# Linked static and position-independent: it needs no loader and no library once its root is empty,
# and it has so few pages that forking it costs half of what a dynamic one costs.
function(keelgate_service name)
  cmake_parse_arguments(arg "" "" "SOURCES;LIBRARIES" ${ARGN})
  add_executable(${name} ${arg_SOURCES}
    ${PROJECT_SOURCE_DIR}/framework/server/service_operators.cpp)
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR} ${PROJECT_SOURCE_DIR}/include)
  target_link_libraries(${name} PRIVATE ${arg_LIBRARIES})
  if(NOT KEELGATE_SANITIZE)
    target_link_options(${name} PRIVATE -static-pie -Wl,-z,noexecstack)
  endif()
endfunction()
