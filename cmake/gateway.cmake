# SPDX-License-Identifier: Apache-2.0
# Looks for what veltra-gateway is built on. Where something is missing, VELTRA_GATEWAY is off for this build.
pkg_check_modules(PQ IMPORTED_TARGET libpq)
find_path(VELTRA_NATS_INCLUDE nats/nats.h)
find_library(VELTRA_NATS_LIBRARY nats)
find_path(VELTRA_BEAST_INCLUDE boost/beast/http.hpp)
foreach(found PQ_FOUND VELTRA_NATS_INCLUDE VELTRA_NATS_LIBRARY VELTRA_BEAST_INCLUDE)
  if(NOT ${found} AND VELTRA_GATEWAY)
    message(STATUS "veltra-gateway is left out: it needs the packages libnats-dev, libpq-dev and libboost-dev")
    set(VELTRA_GATEWAY OFF)
  endif()
endforeach()
