// SPDX-License-Identifier: Apache-2.0
// Hashes and unpacks an uploaded body.
#include "upload_digest.h"

#include <openssl/evp.h>
#include <zlib.h>

#include "base/text.h"

namespace veltrad::lab {
namespace {

// An argument of inflateInit2.
constexpr int kGzipAlone = 31;
constexpr std::size_t kReadBytes = 64u << 10;

std::string hexDigest(EVP_MD_CTX* context) {
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned length = 0;
  EVP_DigestFinal_ex(context, digest, &length);
  return hex({reinterpret_cast<const char*>(digest), length});
}

}  // namespace

UploadDigest::UploadDigest()
    : _packed(EVP_MD_CTX_new(), EVP_MD_CTX_free),
      _plain(EVP_MD_CTX_new(), EVP_MD_CTX_free),
      _stream(std::make_unique<z_stream>()) {
  EVP_DigestInit_ex(_packed.get(), EVP_sha256(), nullptr);
  EVP_DigestInit_ex(_plain.get(), EVP_sha256(), nullptr);
  if (inflateInit2(_stream.get(), kGzipAlone) != Z_OK) _problem = "cannot be unpacked here";
}

UploadDigest::~UploadDigest() {
  inflateEnd(_stream.get());
}

void UploadDigest::add(std::string_view piece) {
  EVP_DigestUpdate(_packed.get(), piece.data(), piece.size());
  _packedBytes += piece.size();
  if (!piece.empty() && _problem.empty()) unpack(piece);
}

void UploadDigest::unpack(std::string_view piece) {
  if (_ended) {
    _problem = "bytes behind the gzip stream";
    return;
  }
  unsigned char plain[kReadBytes];
  _stream->next_in = reinterpret_cast<unsigned char*>(const_cast<char*>(piece.data()));
  _stream->avail_in = static_cast<unsigned>(piece.size());
  do {
    _stream->next_out = plain;
    _stream->avail_out = sizeof plain;
    const int result = inflate(_stream.get(), Z_NO_FLUSH);
    const std::size_t count = sizeof plain - _stream->avail_out;
    EVP_DigestUpdate(_plain.get(), plain, count);
    _plainBytes += count;
    _ended = result == Z_STREAM_END;
    if (_ended && _stream->avail_in > 0) _problem = "bytes behind the gzip stream";
    if (!_ended && result != Z_OK && result != Z_BUF_ERROR) _problem = "no gzip stream";
    if (_plainBytes > kMostPlainBytes) _problem = "unpacks to more than 4 GiB";
  } while (!_ended && _problem.empty() && (_stream->avail_in > 0 || _stream->avail_out == 0));
}

Dictionary UploadDigest::finish() {
  Dictionary fields{{"bytes", _packedBytes}, {"sha256", hexDigest(_packed.get())}};
  if (_problem.empty() && !_ended) _problem = _packedBytes == 0 ? "empty" : "the gzip stream is cut short";
  if (!_problem.empty()) {
    fields.set("problem", _problem);
    return fields;
  }
  fields.set("plainBytes", _plainBytes);
  fields.set("plainSHA256", hexDigest(_plain.get()));
  return fields;
}

}  // namespace veltrad::lab
