# SPDX-License-Identifier: Apache-2.0
# Finds what veltra-gateway is built on.
pkg_check_modules(PQ IMPORTED_TARGET libpq)
find_path(VELTRA_NATS_INCLUDE nats/nats.h)
find_library(VELTRA_NATS_LIBRARY nats)
find_path(VELTRA_BEAST_INCLUDE boost/beast/http.hpp)
foreach(found PQ_FOUND VELTRA_NATS_INCLUDE VELTRA_NATS_LIBRARY VELTRA_BEAST_INCLUDE)
  if(NOT ${found})
    message(FATAL_ERROR "VELTRA_GATEWAY needs the packages libnats-dev, libpq-dev and libboost-dev; \"scripts/setup gateway\" installs them")
  endif()
endforeach()
