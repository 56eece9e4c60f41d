// What a storebag server sends: whatever the bytes are, the one bag that was ever signed is the only one that
// verifies.
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "base/base64.h"
#include "config/storebag_container.h"
#include "config/storebag_content.h"
#include "config/storebag_download.h"
#include "config/storebag_key.h"

namespace {

// The other half of this key is gone; the corpus holds the one bag that it signed.
constexpr const char* kPublicKey =
    "MIIBIjANBgkqhkiG9w0BAQEFAAOCAQ8AMIIBCgKCAQEAmz+TQTAG+uau+1KXlxh/1r9TVcS2g+E3cZAUY6dmJ522cl0O0qL9"
    "OTBOuKhdVTMW1lwMXbf2Lm1s1bBDENx8p22UXRNri8CEjejAan+dM7DFAc0TX+wSIsmc2aOo0WvIZs1mjkv/xAkiX7cmcw7Z"
    "if5gIqR38CD7RAXj+4ZoYhP0uxiR5X76YJfxiSG5dKIBjNnxQ6+meW4YxEL6GQFmpPkvXNhY/pyQZMzm7x5nX79+VuADrcut"
    "/8ZJBYUAmqctT8ps8fMshE0BO7yFNbySr7LONYd9SmglZtmAQZMH3djhLz+l9pJL90Z0KSoe/5gvcJzfo4RnPS3hftDYDlzU"
    "BwIDAQAB";
constexpr const char* kSignedBag =
    "PD94bWwgdmVyc2lvbj0iMS4wIiBlbmNvZGluZz0iVVRGLTgiPz4KPHBsaXN0IHZlcnNpb249IjEuMCI+CjxkaWN0PgoJPGtl"
    "eT5kZXZlbG9wbWVudDwva2V5PgoJPGRpY3Q+CgkJPGtleT5taXZvPC9rZXk+CgkJPGRpY3Q+CgkJCTxrZXk+YWN0aXZlPC9r"
    "ZXk+CgkJCTx0cnVlLz4KCQk8L2RpY3Q+Cgk8L2RpY3Q+Cgk8a2V5PnJlZnJlc2hfY3ljbGU8L2tleT4KCTxpbnRlZ2VyPjM2"
    "MDA8L2ludGVnZXI+Cgk8a2V5PnJlbGVhc2U8L2tleT4KCTxkaWN0PgoJCTxrZXk+ZGFzaGJvYXJkPC9rZXk+CgkJPGRpY3Q+"
    "CgkJCTxrZXk+YWRkcmVzczwva2V5PgoJCQk8c3RyaW5nPjE5Mi4wLjIuMTwvc3RyaW5nPgoJCQk8a2V5PnBvcnQ8L2tleT4K"
    "CQkJPGludGVnZXI+NDk5OTwvaW50ZWdlcj4KCQk8L2RpY3Q+CgkJPGtleT5odHRwcG9zdDwva2V5PgoJCTxkaWN0PgoJCQk8"
    "a2V5PmNsaWVudDwva2V5PgoJCQk8YXJyYXk+CgkJCQk8ZGljdD4KCQkJCQk8a2V5Pm5hbWU8L2tleT4KCQkJCQk8c3RyaW5n"
    "PnBob25lPC9zdHJpbmc+CgkJCQk8L2RpY3Q+CgkJCTwvYXJyYXk+CgkJCTxrZXk+dXJsPC9rZXk+CgkJCTxzdHJpbmc+aHR0"
    "cHM6Ly9jb2xsZWN0b3IuZXhhbXBsZS9lPC9zdHJpbmc+CgkJPC9kaWN0PgoJPC9kaWN0PgoJPGtleT52ZXJzaW9uPC9rZXk+"
    "Cgk8c3RyaW5nPjEuNC4yPC9zdHJpbmc+CjwvZGljdD4KPC9wbGlzdD4K";

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace veltrad;
  static const config::StorebagKey key =
      config::StorebagKey::fromDER(decodeBase64(kPublicKey).value()).value();
  static const std::string signedBag = decodeBase64(kSignedBag).value();
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);

  if (const auto container = config::parseStorebagContainer(bytes)) {
    const auto decoded = config::decodeStorebagContainer(container.value());
    if (decoded && key.verifies(decoded->bag, decoded->signature) && decoded->bag != signedBag) std::abort();
  }
  // What only a signed bag reaches, and what only a header does.
  if (const auto bag = config::parseStorebagBag(bytes)) {
    const auto storebag = config::parsed<config::Storebag>(*bag);
    config::parseSection(storebag.release.value_or(*bag));
  }
  config::maxAgeOfCacheControl(bytes);
  return 0;
}
