// What an uploaded body is, read piece by piece and kept nowhere. One thread at a time.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "base/value.h"

struct evp_md_ctx_st;
struct z_stream_s;

namespace veltrad::lab {

// A body that unpacks to more is a problem.
inline constexpr std::uint64_t kMostPlainBytes = 4ull << 30;

class UploadDigest {
 public:
  UploadDigest();
  ~UploadDigest();
  UploadDigest(const UploadDigest&) = delete;
  UploadDigest& operator=(const UploadDigest&) = delete;

  void add(std::string_view piece);
  // "bytes" and "sha256" of the body, "plainBytes" and "plainSHA256" of what it unpacks to, or "problem"
  // where it is no gzip stream, whole and alone. The last call.
  Dictionary finish();

 private:
  void unpack(std::string_view piece);

  std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> _packed;
  std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> _plain;
  std::unique_ptr<z_stream_s> _stream;
  std::uint64_t _packedBytes = 0;
  std::uint64_t _plainBytes = 0;
  bool _ended = false;  // the stream's trailer has come
  std::string _problem;
};

}  // namespace veltrad::lab
