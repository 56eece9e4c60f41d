// One stream of zlib's deflate with the parameters of everything that is compressed here. One thread at a
// time.
#pragma once

#include <zlib.h>

#include <string>

namespace veltrad {

// What goes wrong is one error line, here and nowhere else. Ends the stream with itself.
class Deflation {
 public:
  enum class Wrapper { gzip, zlib, none };

  Deflation() = default;
  ~Deflation();
  Deflation(const Deflation&) = delete;
  Deflation& operator=(const Deflation&) = delete;

  bool begin(Wrapper wrapper);
  z_stream& stream() { return _stream; }
  // Takes what the stream has been given and appends what comes out, all of it where `flush` says so;
  // `buffer` is room of any size. False: it failed.
  bool append(int flush, std::string& buffer, std::string& output);
  // Says what such a result of deflate() means; false where it is none of the failures.
  bool failed(int result) const;
  static void sayInitialisationFailed(int result, const char* message);

 private:
  z_stream _stream{};
  bool _begun = false;
};

}  // namespace veltrad
