# Compiler settings, and the two functions that create the library targets.

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_INSTALL_RPATH "$ORIGIN/../${CMAKE_INSTALL_LIBDIR}")
if(NOT CMAKE_BUILD_TYPE)
  set(CMAKE_BUILD_TYPE RelWithDebInfo CACHE STRING "Build type" FORCE)
endif()

find_package(Threads REQUIRED)

add_library(ovra_flags INTERFACE)
target_compile_options(ovra_flags INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion -Wformat=2 -Wundef
  -Wcast-qual -Woverloaded-virtual -Wno-missing-field-initializers
  $<$<BOOL:${OVRADRNODE_WERROR}>:-Werror>
  -fstack-protector-strong
  "-ffile-prefix-map=${CMAKE_SOURCE_DIR}/=")
if(CMAKE_BUILD_TYPE STREQUAL "Release" OR CMAKE_BUILD_TYPE STREQUAL "RelWithDebInfo")
  target_compile_options(ovra_flags INTERFACE -U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=2)
endif()
target_link_options(ovra_flags INTERFACE -Wl,-z,relro,-z,now -Wl,--as-needed)
if(OVRADRNODE_SANITIZE)
  target_compile_options(ovra_flags INTERFACE
    "-fsanitize=${OVRADRNODE_SANITIZE}" -fno-omit-frame-pointer -fno-sanitize-recover=all)
  target_link_options(ovra_flags INTERFACE "-fsanitize=${OVRADRNODE_SANITIZE}")
endif()
if(OVRADRNODE_COVERAGE)
  target_compile_options(ovra_flags INTERFACE --coverage)
  target_link_options(ovra_flags INTERFACE --coverage)
endif()

# ovra_layer(NAME SOURCES ... [LINK ...]): one layer as an object library. The same objects go into
# the shared library and into the tests.
function(ovra_layer name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINK" ${ARGN})
  add_library(${name} OBJECT ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ovra_flags PUBLIC ${ARG_LINK})
endfunction()

# ovra_shared(NAME VERSION_SCRIPT OBJECTS ... LINK ...): the shared library of these layers.
function(ovra_shared name version_script)
  cmake_parse_arguments(ARG "" "" "OBJECTS;LINK" ${ARGN})
  add_library(${name} SHARED)
  foreach(object ${ARG_OBJECTS})
    target_link_libraries(${name} PRIVATE $<BUILD_INTERFACE:${object}>)
  endforeach()
  target_link_libraries(${name} PRIVATE $<BUILD_INTERFACE:ovra_flags>
    PUBLIC PkgConfig::jsoncpp ${ARG_LINK})
  set_target_properties(${name} PROPERTIES
    VERSION ${PROJECT_VERSION}
    SOVERSION ${PROJECT_VERSION_MAJOR}
    LINKER_LANGUAGE CXX
    LINK_DEPENDS ${version_script})
  target_link_options(${name} PRIVATE "-Wl,--version-script=${version_script}")
  if(NOT OVRADRNODE_SANITIZE)
    # With clang the program brings the sanitizers' functions, not the library.
    target_link_options(${name} PRIVATE -Wl,--no-undefined)
  endif()
endfunction()
