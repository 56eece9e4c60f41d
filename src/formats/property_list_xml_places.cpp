// SPDX-License-Identifier: Apache-2.0
// Finds the places of the keys and values of an XML property list, with Expat. Any thread.
#include <expat.h>

#include <memory>
#include <utility>

#include "formats/places.h"

namespace veltrad::formats {

namespace {

// The list was read before, so its elements stand where they may.
class PlacesOfXML {
 public:
  Places read(std::string_view bytes) {
    if (!_parser) return {};
    XML_SetUserData(_parser.get(), this);
    XML_SetElementHandler(
        _parser.get(), [](void* self, const XML_Char* name, const XML_Char**) { from(self).begin(name); },
        [](void* self, const XML_Char* name) { from(self).end(name); });
    XML_SetCharacterDataHandler(_parser.get(), [](void* self, const XML_Char* text, int length) {
      if (from(self)._isKey) from(self)._open.back().key.append(text, static_cast<std::size_t>(length));
    });
    XML_Parse(_parser.get(), bytes.data(), static_cast<int>(bytes.size()), XML_TRUE);
    return std::move(_top);
  }

 private:
  struct Open {
    bool isDictionary;
    Places places;
    // Of a dictionary the key that was read last.
    std::string key;
    TextPlace keyPlace;
  };

  static PlacesOfXML& from(void* self) { return *static_cast<PlacesOfXML*>(self); }

  TextPlace here() const {
    return {XML_GetCurrentLineNumber(_parser.get()), XML_GetCurrentColumnNumber(_parser.get()) + 1};
  }

  void begin(std::string_view name) {
    if (name == "plist") return;
    _isKey = name == "key";
    if (_isKey) {
      _open.back().keyPlace = here();
    } else {
      _open.push_back({name == "dict", {here(), {}, {}}, {}, {}});
    }
  }

  void end(std::string_view name) {
    _isKey = false;
    if (name == "plist" || name == "key") return;
    Places done = std::move(_open.back().places);
    _open.pop_back();
    if (_open.empty()) {
      _top = std::move(done);
    } else if (_open.back().isDictionary) {
      Open& open = _open.back();
      open.places.members.push_back({std::exchange(open.key, {}), open.keyPlace, std::move(done)});
    } else {
      _open.back().places.elements.push_back(std::move(done));
    }
  }

  const std::unique_ptr<std::remove_pointer_t<XML_Parser>, void (*)(XML_Parser)> _parser{
      XML_ParserCreate(nullptr), XML_ParserFree};
  bool _isKey = false;
  std::vector<Open> _open;
  Places _top;
};

}  // namespace

Places placesInXMLPropertyList(std::string_view bytes) {
  return PlacesOfXML().read(bytes);
}

}  // namespace veltrad::formats
