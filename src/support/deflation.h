// One stream of zlib's deflate with the parameters of everything that is compressed here. One thread at a
// time.
#pragma once

#include <zlib.h>

#include <functional>
#include <string>
#include <string_view>

namespace veltrad::support {

// Takes the next bytes of an output. False: it can take no more, and a line has said why.
using ByteSink = std::function<bool(std::string_view bytes)>;

// What goes wrong is one error line, here and nowhere else. Ends the stream with itself.
class Deflation {
 public:
  enum class Wrapper { gzip, zlib };

  Deflation() = default;
  ~Deflation();
  Deflation(const Deflation&) = delete;
  Deflation& operator=(const Deflation&) = delete;

  bool begin(Wrapper wrapper);
  z_stream& stream() { return _stream; }
  // Takes what the stream has been given and hands on what comes out, all of it where `flush` says so;
  // `buffer` is room of any size. False: it failed.
  bool append(int flush, std::string& buffer, const ByteSink& sink);
  // Says what such a result of deflate() means; false where it is none of the failures.
  bool failed(int result) const;

 private:
  z_stream _stream{};
  bool _begun = false;
};

}  // namespace veltrad::support
