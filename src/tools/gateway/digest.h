// SPDX-License-Identifier: Apache-2.0
// SHA-256 of bytes that come in pieces.
#pragma once

#include <memory>
#include <string>
#include <string_view>

struct evp_md_ctx_st;

namespace veltrad::gateway {

class Digest {
 public:
  Digest();
  void add(std::string_view bytes);
  // 64 lower-case hexadecimal digits. Called once.
  std::string hexDigits();

 private:
  std::shared_ptr<evp_md_ctx_st> _context;
};

std::string digestOf(std::string_view first, std::string_view second);

}  // namespace veltrad::gateway
