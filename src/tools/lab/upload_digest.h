// SPDX-License-Identifier: Apache-2.0
// Describes an uploaded body, which is read piece by piece and not kept.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "base/value.h"

struct evp_md_ctx_st;
struct z_stream_s;

namespace veltrad::lab {

// A body that unpacks to more is reported as a problem.
inline constexpr std::uint64_t kMostPlainBytes = 4ull << 30;

class UploadDigest {
 public:
  UploadDigest();
  ~UploadDigest();

  void add(std::string_view piece);
  // "bytes" and "sha256" of the body, and "plainBytes" and "plainSHA256" of what it unpacks to, or a
  // "problem" if it is not exactly one gzip stream. Called once, at the end.
  Dictionary finish();

 private:
  void unpack(std::string_view piece);

  std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> _packed;
  std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> _plain;
  std::unique_ptr<z_stream_s> _stream;
  std::uint64_t _packedBytes = 0;
  std::uint64_t _plainBytes = 0;
  // The end of the stream has been read.
  bool _ended = false;
  std::string _problem;
};

}  // namespace veltrad::lab
