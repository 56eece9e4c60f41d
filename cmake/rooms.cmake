# SPDX-License-Identifier: Apache-2.0
# Warnings, sanitizers, and veltra_room(), which defines one library for each folder of src/.
#
# A room's headers are visible only to the rooms that link it: its include directory is build/PRESET/rooms/ROOM, which
# contains only a link to src/ROOM. An include that points up the ladder therefore does not compile.

add_library(veltra_options INTERFACE)
if(VELTRA_WARNINGS)
  target_compile_options(veltra_options INTERFACE -Wall -Wextra -Wconversion -Werror)
endif()
target_compile_options(veltra_options INTERFACE -fno-omit-frame-pointer)
if(VELTRA_WARNINGS)
  target_compile_options(veltra_options INTERFACE
    $<$<COMPILE_LANG_AND_ID:CXX,Clang>:-Wthread-safety -Wthread-safety-beta>)
  # GCC 12 reports overlaps in std::string's operator+ and uninitialized members in moved variants that do not exist.
  target_compile_options(veltra_options INTERFACE
    "$<$<COMPILE_LANG_AND_ID:CXX,GNU>:-Wno-restrict;-Wno-maybe-uninitialized>")
endif()
if(NOT CMAKE_BUILD_TYPE STREQUAL "Debug")
  # What is shipped names no folder in which it was built. The build folder may lie inside the source folder; of two
  # matching prefixes GCC replaces the one that was given last.
  target_compile_options(veltra_options INTERFACE
    -ffile-prefix-map=${PROJECT_SOURCE_DIR}=. -ffile-prefix-map=${PROJECT_BINARY_DIR}=build)
  # The linker drops the functions that a program does not use; they would be resident beside those that it does.
  target_compile_options(veltra_options INTERFACE -ffunction-sections -fdata-sections)
  target_link_options(veltra_options INTERFACE -Wl,--gc-sections)
endif()
if(VELTRA_SANITIZE)
  target_compile_options(veltra_options INTERFACE -fsanitize=${VELTRA_SANITIZE} -fno-sanitize-recover=all
    $<IF:$<BOOL:$<TARGET_PROPERTY:VELTRA_UNOPTIMIZED>>,-O0,-O1> -g1)
  # The vptr check opens a pipe, so it reports errors in a process that has no free descriptor.
  if(VELTRA_SANITIZE MATCHES "undefined")
    target_compile_options(veltra_options INTERFACE -fno-sanitize=vptr)
  endif()
  target_compile_options(veltra_options INTERFACE
    $<$<CXX_COMPILER_ID:Clang>:-fsanitize-ignorelist=${PROJECT_SOURCE_DIR}/cmake/sanitizer_ignorelist.txt>)
  target_link_options(veltra_options INTERFACE -fsanitize=${VELTRA_SANITIZE})
endif()
if(VELTRA_FUZZ)
  target_compile_options(veltra_options INTERFACE -fsanitize=fuzzer-no-link)
endif()
target_link_libraries(veltra_options INTERFACE Threads::Threads)
# A program loads only the libraries that it uses, not all that its rooms link.
target_link_options(veltra_options INTERFACE -Wl,--as-needed)

# veltra_rung(NAME…): defines the rooms of the next rung. They may link rooms of lower rungs, but not each other.
macro(veltra_rung)
  foreach(room ${ARGN})
    add_subdirectory(${room})
  endforeach()
  list(APPEND VELTRA_ROOMS_BELOW ${ARGN})
endmacro()

# veltra_room(NAME [PUBLIC libs…] [PRIVATE libs…] [EXCLUDE regex] [HEADERS holder]): a library of every .cpp file under the
# current folder; for the holder see compile_time.cmake.
function(veltra_room name)
  cmake_parse_arguments(ROOM "" "EXCLUDE;HEADERS" "PUBLIC;PRIVATE" ${ARGN})
  foreach(library ${ROOM_PUBLIC} ${ROOM_PRIVATE})
    string(REGEX REPLACE "^veltra_" "" below "${library}")
    if(library MATCHES "^veltra_" AND NOT below IN_LIST VELTRA_ROOMS_BELOW)
      message(FATAL_ERROR "${name} links ${below}, which is on no rung below its own")
    endif()
  endforeach()
  file(GLOB_RECURSE sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cpp)
  if(ROOM_EXCLUDE)
    list(FILTER sources EXCLUDE REGEX "${ROOM_EXCLUDE}")
  endif()
  file(MAKE_DIRECTORY ${PROJECT_BINARY_DIR}/rooms/${name})
  file(CREATE_LINK ${CMAKE_CURRENT_SOURCE_DIR} ${PROJECT_BINARY_DIR}/rooms/${name}/${name} SYMBOLIC)
  if(sources)
    add_library(veltra_${name} STATIC ${sources})
    target_include_directories(veltra_${name} PUBLIC ${PROJECT_BINARY_DIR}/rooms/${name})
    target_link_libraries(veltra_${name} PUBLIC ${ROOM_PUBLIC} PRIVATE veltra_options ${ROOM_PRIVATE})
    set_target_properties(veltra_${name} PROPERTIES CXX_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON)
    if(NOT ROOM_HEADERS)
      set(ROOM_HEADERS room_headers)
    endif()
    veltra_precompile(veltra_${name} ${ROOM_HEADERS})
  else()
    add_library(veltra_${name} INTERFACE)
    target_include_directories(veltra_${name} INTERFACE ${PROJECT_BINARY_DIR}/rooms/${name})
    target_link_libraries(veltra_${name} INTERFACE ${ROOM_PUBLIC} ${ROOM_PRIVATE})
  endif()
endfunction()
