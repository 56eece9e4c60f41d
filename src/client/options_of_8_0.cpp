// SPDX-License-Identifier: Apache-2.0
// Symbols that libveltra exports to programs built with 8.0. Not part of the room, because only a shared
// object has symbol versions.
#include <cstring>

#include "client/session_options.h"

// Their struct of options is smaller than today's.
extern "C" void options_init_of_8_0(veltra_session_options* options);
__asm__(".symver options_init_of_8_0, veltra_session_options_init@VELTRA_8");

void options_init_of_8_0(veltra_session_options* options) {
  if (!options) return;
  std::memset(static_cast<void*>(options), 0, veltrad::client::kSizeOf80);
  options->size = veltrad::client::kSizeOf80;
}
