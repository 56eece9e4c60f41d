# SPDX-License-Identifier: Apache-2.0
# Shortens the build without changing its result: precompiled headers and lld, for the presets that use Clang. Unity builds
# are switched on in CMakePresets.json. Figures: docs/decisions/0017-build-time.md.

# GCC builds, as shipped, read every header again, which reveals missing includes. So do builds through a compiler
# cache, because it can hardly share files that were compiled with a precompiled header.
set(VELTRA_PRECOMPILE_DEFAULT OFF)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang" AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
  set(VELTRA_PRECOMPILE_DEFAULT ON)
endif()
option(VELTRA_PRECOMPILE "Precompile the headers of the standard library, fmt and GoogleTest" ${VELTRA_PRECOMPILE_DEFAULT})

set(VELTRA_COMMON_HEADERS <fmt/format.h> <algorithm> <atomic> <chrono> <functional> <map> <memory> <mutex> <optional> <string>
    <string_view> <thread> <utility> <variant> <vector>)

# veltra_precompile(TARGET HOLDER): the target uses the precompiled headers of HOLDER: room_headers, tool_headers or
# test_headers. The sanitizers' presets do not optimize tools and tests: that would take most of the time of compiling them, and
# they run little code. A holder's headers serve one level of optimization.
function(veltra_precompile target holder)
  if(NOT holder STREQUAL room_headers)
    set_target_properties(${target} PROPERTIES VELTRA_UNOPTIMIZED ON)
  endif()
  if(VELTRA_PRECOMPILE)
    target_precompile_headers(${target} REUSE_FROM ${holder})
  endif()
endfunction()

# Libraries and programs are compiled as different kinds of position-independent code, so each has a holder of its kind.
if(VELTRA_PRECOMPILE)
  file(WRITE ${CMAKE_BINARY_DIR}/no_code.cpp "")
  foreach(holder room_headers tool_headers)
    add_library(${holder} STATIC ${CMAKE_BINARY_DIR}/no_code.cpp)
    set_target_properties(${holder} PROPERTIES CXX_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON)
    target_link_libraries(${holder} PRIVATE veltra_options fmt::fmt)
    target_precompile_headers(${holder} PRIVATE ${VELTRA_COMMON_HEADERS})
  endforeach()
  set_target_properties(tool_headers PROPERTIES VELTRA_UNOPTIMIZED ON)
  target_precompile_headers(tool_headers PRIVATE <CLI/CLI.hpp>)
  if(VELTRA_TESTS)
    file(WRITE ${CMAKE_BINARY_DIR}/test_headers.cpp "int main() {}\n")
    add_executable(test_headers ${CMAKE_BINARY_DIR}/test_headers.cpp)
    set_target_properties(test_headers PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/headers VELTRA_UNOPTIMIZED ON)
    target_link_libraries(test_headers PRIVATE veltra_options fmt::fmt GTest::gmock)
    target_precompile_headers(test_headers PRIVATE <gmock/gmock.h> <gtest/gtest.h> <filesystem> <fstream> ${VELTRA_COMMON_HEADERS})
  endif()
endif()

find_program(VELTRA_LLD ld.lld)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang" AND VELTRA_LLD)
  target_link_options(veltra_options INTERFACE -fuse-ld=lld)
endif()
