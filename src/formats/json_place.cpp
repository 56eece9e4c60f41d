// SPDX-License-Identifier: Apache-2.0
// Where in a JSON text a key or an element stands. Any thread.
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include "formats/json.h"

namespace veltrad::formats {

namespace {

// Follows RapidJSON's events, which it therefore names its operations after, and ends the reading at the
// place.
class Search {
 public:
  Search(std::string_view text, const rapidjson::MemoryStream& stream, const std::vector<std::string>& path)
      : _text(text), _stream(stream), _path(path) {}

  bool Null() { return scalar(); }
  bool Bool(bool) { return scalar(); }
  bool Int(int) { return scalar(); }
  bool Uint(unsigned) { return scalar(); }
  bool Int64(std::int64_t) { return scalar(); }
  bool Uint64(std::uint64_t) { return scalar(); }
  bool Double(double) { return scalar(); }
  bool RawNumber(const char*, rapidjson::SizeType, bool) { return scalar(); }
  bool String(const char*, rapidjson::SizeType, bool) { return scalar(); }
  bool StartObject() { return open(false); }
  bool StartArray() { return open(true); }
  bool EndObject(rapidjson::SizeType) { return close(); }
  bool EndArray(rapidjson::SizeType) { return close(); }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    Open& open = _open.back();
    open.matches = isOnPath() && _path[_open.size() - 1] == std::string_view(text, length);
    return !found(open.matches, startOfToken());
  }

  std::optional<std::size_t> place() const { return _place; }

 private:
  struct Open {
    bool isArray;
    bool matches = false;  // its present entry is the path's
    std::size_t elements = 0;
  };

  // Whether everything around the innermost container's entries is the path's.
  bool isOnPath() const {
    if (_open.size() > _path.size()) return false;
    for (std::size_t i = 0; i + 1 < _open.size(); ++i)
      if (!_open[i].matches) return false;
    return true;
  }
  bool found(bool matches, std::size_t start) {
    if (matches && _open.size() == _path.size()) _place = start;
    return _place.has_value();
  }
  // True: the reading goes on.
  bool element(std::size_t start) {
    if (_open.empty() || !_open.back().isArray) return true;
    Open& open = _open.back();
    open.matches = isOnPath() && _path[_open.size() - 1] == std::to_string(open.elements);
    ++open.elements;
    return !found(open.matches, start);
  }
  bool scalar() { return element(startOfToken()); }
  bool open(bool isArray) {
    if (!element(_stream.Tell())) return false;  // its bracket is still to be taken
    _open.push_back({isArray});
    return true;
  }
  bool close() {
    _open.pop_back();
    return true;
  }
  // Of the token that has just been read.
  std::size_t startOfToken() const {
    std::size_t at = _stream.Tell() - 1;
    const auto isPart = [&](std::size_t i) {
      constexpr std::string_view kEnds = " \t\r\n,:[{/";
      return kEnds.find(_text[i]) == std::string_view::npos;
    };
    if (_text[at] == '"') {
      const auto isEscaped = [&](std::size_t i) {
        std::size_t backslashes = 0;
        while (backslashes < i && _text[i - 1 - backslashes] == '\\') ++backslashes;
        return backslashes % 2 == 1;
      };
      do --at;
      while (_text[at] != '"' || isEscaped(at));
    } else if (isPart(at)) {
      while (at > 0 && isPart(at - 1)) --at;
    }
    return at;
  }

  const std::string_view _text;
  const rapidjson::MemoryStream& _stream;
  const std::vector<std::string>& _path;
  std::vector<Open> _open;
  std::optional<std::size_t> _place;
};

}  // namespace

std::optional<std::size_t> offsetInJSON(std::string_view text, const std::vector<std::string>& path) {
  constexpr unsigned kFlags =
      rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseCommentsFlag;
  rapidjson::MemoryStream stream(text.data(), text.size());
  Search search(text, stream, path);
  rapidjson::Reader reader;
  reader.Parse<kFlags>(stream, search);
  return search.place();
}

}  // namespace veltrad::formats
