// SPDX-License-Identifier: Apache-2.0
// Reads XML property lists from untrusted bytes, with Expat over one bounded buffer.
#include <expat.h>
#include <fmt/format.h>
#include <malloc.h>

#include <cstdlib>
#include <limits>
#include <memory>
#include <new>

#include "base/base64.h"
#include "base/text.h"
#include "formats/property_list.h"
#include "formats/property_list_xml_scalars.h"

namespace veltrad::formats {

namespace {

using namespace xml_property_list;
using Kind = PropertyListError::Kind;

enum class Element { plist, dict, array, key, string, integer, real, true_, false_, date, data, unknown };

Element elementNamed(std::string_view name) {
  constexpr std::pair<std::string_view, Element> kNames[] = {
      {"key", Element::key},      {"string", Element::string}, {"integer", Element::integer},
      {"dict", Element::dict},    {"array", Element::array},   {"true", Element::true_},
      {"false", Element::false_}, {"real", Element::real},     {"date", Element::date},
      {"data", Element::data},    {"plist", Element::plist},
  };
  for (const auto& [known, element] : kNames) {
    if (known == name) return element;
  }
  return Element::unknown;
}

// The expected text of a leaf element, for errors.
const char* expectedIn(Element leaf) {
  switch (leaf) {
    case Element::integer:
      return "an integer of 64 bits";
    case Element::real:
      return "a real";
    case Element::date:
      return "a date like 2001-01-01T00:00:00Z";
    case Element::data:
      return "base64";
    default:
      return "an empty element";
  }
}

// True for markup after an optional byte order mark and blanks. For UTF-16, the mark is enough.
bool looksLikeXML(std::string_view bytes) {
  if (bytes.starts_with("\xFE\xFF") || bytes.starts_with("\xFF\xFE")) return true;
  if (bytes.starts_with("\xEF\xBB\xBF")) bytes.remove_prefix(3);
  return trimmed(bytes).starts_with('<');
}

// Limits the memory of the parser, which does not include the values made. Without a limit, a start tag full
// of attributes takes 17 times its length. Expat passes no argument to its allocator, hence the thread-local
// pointer; it is set while a Reader exists, and readers do not nest.
class ParserMemory {
 public:
  explicit ParserMemory(std::size_t limit) : _limit(limit) { current = this; }
  ~ParserMemory() { current = nullptr; }
  ParserMemory(const ParserMemory&) = delete;

  static const XML_Memory_Handling_Suite* suite() {
    static constexpr XML_Memory_Handling_Suite kSuite = {
        [](std::size_t size) { return current->resize(nullptr, size); },
        [](void* block, std::size_t size) { return current->resize(block, size); },
        [](void* block) { current->release(block); }};
    return &kSuite;
  }
  // There was no memory, within the limit.
  bool isShort() const { return _isShort; }

 private:
  void* resize(void* block, std::size_t size) {
    const std::size_t before = malloc_usable_size(block);
    if (_used - before + size > _limit) return nullptr;
    void* resized = std::realloc(block, size);
    if (!resized) {
      _isShort = true;
      return nullptr;
    }
    _used = _used - before + malloc_usable_size(resized);
    return resized;
  }
  void release(void* block) {
    _used -= malloc_usable_size(block);
    std::free(block);
  }

  static thread_local ParserMemory* current;
  const std::size_t _limit;
  std::size_t _used = 0;
  bool _isShort = false;
};
thread_local ParserMemory* ParserMemory::current = nullptr;

// Reads one list.
class Reader {
 public:
  Reader(std::size_t bytes, const PropertyListLimits& limits)
      : _memory(4 * bytes + (1u << 20)),
        _parser(XML_ParserCreate_MM(nullptr, ParserMemory::suite(), nullptr), XML_ParserFree),
        _objectsLeft(limits.objects),
        _textLeft(limits.textBytes),
        _depthLimit(static_cast<std::size_t>(limits.depth)) {}

  Result<Value, PropertyListError> read(std::string_view bytes) {
    if (!_parser) throw std::bad_alloc();
    setHandlers();
    const XML_Status status =
        XML_Parse(_parser.get(), bytes.data(), static_cast<int>(bytes.size()), XML_TRUE);
    if (_memory.isShort()) throw std::bad_alloc();  // says nothing of the list
    if (status != XML_STATUS_OK && !failed()) {
      const XML_Error code = XML_GetErrorCode(_parser.get());
      fail(code == XML_ERROR_NO_MEMORY ? Kind::tooLarge : Kind::malformed,
           code == XML_ERROR_NO_MEMORY ? "tags too long" : XML_ErrorString(code));
    }
    if (!failed() && !_value) fail(Kind::malformed, "<plist> holds no value");
    if (failed()) return Failure{std::move(*_error)};
    return std::move(*_value);
  }

 private:
  // A container that is being read.
  struct Open {
    bool isDictionary;
    Array array;
    std::vector<Dictionary::Entry> entries;
    // Read, but its value has not been read yet.
    std::optional<std::string> key;
  };

  static Reader& from(void* self) { return *static_cast<Reader*>(self); }

  void setHandlers() {
    XML_Parser parser = _parser.get();
    XML_SetUserData(parser, this);
    XML_SetElementHandler(
        parser,
        [](void* self, const XML_Char* name, const XML_Char** attributes) {
          from(self).begin(name, attributes);
        },
        [](void* self, const XML_Char*) { from(self).end(); });
    XML_SetCharacterDataHandler(parser, [](void* self, const XML_Char* text, int length) {
      from(self).characters({text, static_cast<std::size_t>(length)});
    });
    XML_SetStartDoctypeDeclHandler(
        parser, [](void* self, const XML_Char*, const XML_Char*, const XML_Char*, int hasInternalSubset) {
          if (hasInternalSubset) from(self).fail(Kind::forbidden, "a document type with an internal subset");
        });
    XML_SetEntityDeclHandler(parser, [](void* self, const XML_Char*, int, const XML_Char*, int,
                                        const XML_Char*, const XML_Char*, const XML_Char*, const XML_Char*) {
      from(self).fail(Kind::forbidden, "an entity declaration");
    });
    // Entities may be declared in the external subset, which is never fetched.
    XML_SetSkippedEntityHandler(parser, [](void* self, const XML_Char* name, int) {
      from(self).fail(Kind::forbidden, fmt::format("a reference to the entity \"{:.40}\"", name));
    });
    XML_SetExternalEntityRefHandlerArg(parser, parser);
    XML_SetExternalEntityRefHandler(
        parser, [](XML_Parser, const XML_Char*, const XML_Char*, const XML_Char*, const XML_Char*) -> int {
          return XML_STATUS_ERROR;
        });
  }

  // Keeps the first error and stops the parser.
  void fail(Kind kind, std::string_view what) {
    if (failed()) return;
    const TextPlace place{XML_GetCurrentLineNumber(_parser.get()),
                          XML_GetCurrentColumnNumber(_parser.get()) + 1};
    _error = {kind, std::string(what), place};
    XML_StopParser(_parser.get(), XML_FALSE);
  }

  bool failed() const { return _error.has_value(); }

  void begin(std::string_view name, const XML_Char** attributes) {
    if (failed()) return;
    const Element element = elementNamed(name);
    if (!_inPlist) return beginPlist(element, name, attributes);
    if (!mayStandHere(element, name)) return;
    if (_objectsLeft == 0) return fail(Kind::tooLarge, "more objects than the limit");
    --_objectsLeft;
    if (element != Element::dict && element != Element::array) {
      _leaf = element;
      _text.clear();
      return;
    }
    if (_open.size() >= _depthLimit)
      return fail(Kind::tooDeep, fmt::format("nested deeper than {}", _depthLimit));
    _open.push_back({element == Element::dict, {}, {}, {}});
  }

  void beginPlist(Element element, std::string_view name, const XML_Char** attributes) {
    if (element != Element::plist) {
      return fail(Kind::notAPropertyList, fmt::format("<{:.40}> where <plist> is expected", name));
    }
    for (; *attributes; attributes += 2) {
      if (std::string_view(attributes[0]) == "version" && std::string_view(attributes[1]) != "1.0") {
        return fail(Kind::malformed,
                    fmt::format("version \"{:.40}\" where \"1.0\" is expected", attributes[1]));
      }
    }
    _inPlist = true;
  }

  bool mayStandHere(Element element, std::string_view name) {
    std::string_view what;
    const bool keyExpected = !_open.empty() && _open.back().isDictionary && !_open.back().key;
    if (element == Element::unknown || element == Element::plist) {
      what = "unknown element";
    } else if (_leaf) {
      what = "an element inside a text:";
    } else if (_open.empty() && _value) {
      what = "a second value:";
    } else if (keyExpected && element != Element::key) {
      what = "a value without a key:";
    } else if (!keyExpected && element == Element::key) {
      what = "a key where a value is expected:";
    } else {
      return true;
    }
    fail(Kind::malformed, fmt::format("{} <{:.40}>", what, name));
    return false;
  }

  bool chargeText(std::size_t bytes) {
    if (bytes > _textLeft) {
      fail(Kind::tooLarge, "more bytes of texts and data than the limit");
      return false;
    }
    _textLeft -= bytes;
    return true;
  }

  void end() {
    if (failed()) return;
    if (_leaf) {
      finishLeaf();
    } else if (!_open.empty()) {
      finishContainer();
    }
  }

  void characters(std::string_view text) {
    if (failed()) return;
    if (!_leaf) {
      if (!trimmed(text).empty()) fail(Kind::malformed, "text between the elements");
      return;
    }
    const bool kept = *_leaf == Element::string || *_leaf == Element::key;
    if (!kept || chargeText(text.size())) _text.append(text);
  }

  void finishLeaf() {
    if (*_leaf == Element::key) {
      _open.back().key = std::move(_text);
      _leaf.reset();
      return;
    }
    auto value = leafValue();
    if (failed()) return;
    if (!value) {
      return fail(Kind::malformed,
                  fmt::format("\"{:.40}\" where {} is expected", trimmed(_text), expectedIn(*_leaf)));
    }
    _leaf.reset();
    add(std::move(*value));
  }

  std::optional<Value> leafValue() {
    switch (*_leaf) {
      case Element::string:
        return Value(std::move(_text));
      case Element::integer:
        return parseInteger(_text);
      case Element::real:
        return parseReal(_text);
      case Element::true_:
      case Element::false_:
        return trimmed(_text).empty() ? std::optional<Value>(*_leaf == Element::true_) : std::nullopt;
      case Element::date:
        return parseDate(_text);
      default:
        return dataValue();
    }
  }

  std::optional<Value> dataValue() {
    // The decoder skips all other characters; here only blanks may be skipped.
    constexpr std::string_view kAllowed =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/= \t\r\n";
    if (_text.find_first_not_of(kAllowed) != std::string::npos) return std::nullopt;
    auto bytes = decodeBase64(_text);
    if (!bytes || !chargeText(bytes->size())) return std::nullopt;
    return Value(Data{std::move(*bytes)});
  }

  void finishContainer() {
    Open& open = _open.back();
    if (open.key) return fail(Kind::malformed, fmt::format("no value for the key \"{:.40}\"", *open.key));
    Value value = open.isDictionary ? Value(Dictionary::fromEntries(std::move(open.entries)))
                                    : Value(std::move(open.array));
    _open.pop_back();
    add(std::move(value));
  }

  void add(Value value) {
    if (_open.empty()) {
      _value = std::move(value);
    } else if (Open& open = _open.back(); open.isDictionary) {
      open.entries.emplace_back(std::move(*open.key), std::move(value));
      open.key.reset();
    } else {
      open.array.push_back(std::move(value));
    }
  }

  ParserMemory _memory;
  const std::unique_ptr<std::remove_pointer_t<XML_Parser>, void (*)(XML_Parser)> _parser;
  std::size_t _objectsLeft;
  std::size_t _textLeft;
  const std::size_t _depthLimit;
  bool _inPlist = false;
  // The leaf element that is being read, and its text so far.
  std::optional<Element> _leaf;
  std::string _text;
  std::vector<Open> _open;
  std::optional<Value> _value;
  std::optional<PropertyListError> _error;
};

}  // namespace

Result<Value, PropertyListError> parseXMLPropertyList(std::string_view bytes,
                                                      const PropertyListLimits& limits) {
  if (!looksLikeXML(bytes)) {
    return Failure{
        PropertyListError{Kind::notAPropertyList, "neither \"bplist00\" nor XML at its beginning"}};
  }
  if (bytes.size() > limits.bytes || bytes.size() > std::numeric_limits<int>::max()) {
    return Failure{PropertyListError{
        Kind::tooLarge, fmt::format("{} bytes, at most {} are read", bytes.size(), limits.bytes)}};
  }
  return Reader(bytes.size(), limits).read(bytes);
}

}  // namespace veltrad::formats
