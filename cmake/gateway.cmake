# SPDX-License-Identifier: Apache-2.0
# Finds the libraries of veltra-gateway and sets VELTRA_GATEWAY to ON or OFF. AUTO, the default, builds the program if all
# libraries are found.
pkg_check_modules(NATS QUIET IMPORTED_TARGET libnats)
pkg_check_modules(PQ QUIET IMPORTED_TARGET libpq)
find_package(Boost QUIET)
find_path(VELTRA_BEAST_INCLUDE boost/beast/http.hpp HINTS ${Boost_INCLUDE_DIRS})
if(NOT Boost_FOUND OR NOT VELTRA_BEAST_INCLUDE)
  set(BEAST_FOUND FALSE)
else()
  set(BEAST_FOUND TRUE)
endif()

set(missing)
foreach(row "NATS|libnats|libnats-dev" "PQ|libpq|libpq-dev" "BEAST|Boost.Beast|libboost-dev")
  string(REPLACE "|" ";" row "${row}")
  list(GET row 0 prefix)
  list(GET row 1 library)
  list(GET row 2 package)
  if(NOT ${prefix}_FOUND)
    list(APPEND missing "${library} (Debian package ${package})")
  endif()
endforeach()
list(JOIN missing ", " missing)

# The variable hides the cache entry, so that a later configuration searches again.
if(NOT missing)
  set(VELTRA_GATEWAY ON)
elseif(VELTRA_GATEWAY STREQUAL AUTO)
  message(STATUS "veltra-gateway is left out, because these are missing: ${missing}")
  set(VELTRA_GATEWAY OFF)
else()
  message(FATAL_ERROR "VELTRA_GATEWAY is ${VELTRA_GATEWAY}, but these are missing: ${missing}; \"scripts/setup gateway\" installs them")
endif()
