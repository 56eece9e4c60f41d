// SPDX-License-Identifier: Apache-2.0
// Writes XML property lists in UTF-8, indented by tabs.
#include <fmt/format.h>

#include "base/base64.h"
#include "base/text.h"
#include "formats/property_list.h"
#include "formats/property_list_xml_scalars.h"

namespace veltrad::formats {

namespace {

// False for characters that XML cannot represent and for bytes that are not valid UTF-8: they become U+FFFD.
bool isWritable(const UTF8Character& character) {
  if (character.length == 0) return false;
  const char32_t code = character.code;
  return code >= 0x20 ? code != 0xFFFE && code != 0xFFFF : code == '\t' || code == '\n' || code == '\r';
}

class Writer {
 public:
  explicit Writer(std::string& out) : _out(out) {}

  void put(const Value& value, std::size_t depth) {
    switch (value.type()) {
      case Value::Type::boolean:
        return line(depth, *value.toBoolean() ? "<true/>" : "<false/>");
      case Value::Type::signedInteger:
        return line(depth, fmt::format("<integer>{}</integer>", *value.asSigned()));
      case Value::Type::unsignedInteger:
        return line(depth, fmt::format("<integer>{}</integer>", *value.asUnsigned()));
      case Value::Type::real:
        return line(depth, fmt::format("<real>{}</real>", *value.asReal()));
      case Value::Type::string:
        return putText(depth, "string", *value.asString());
      case Value::Type::date:
        return line(depth, "<date>" + xml_property_list::dateText(*value.asDate()) + "</date>");
      case Value::Type::data:
        return line(depth, "<data>" + encodeBase64(value.asData()->bytes) + "</data>");
      case Value::Type::array:
        line(depth, "<array>");
        for (const Value& element : *value.asArray()) put(element, depth + 1);
        return line(depth, "</array>");
      case Value::Type::dictionary:
        line(depth, "<dict>");
        for (const auto& [key, held] : *value.asDictionary()) {
          putText(depth + 1, "key", key);
          put(held, depth + 1);
        }
        return line(depth, "</dict>");
    }
  }

 private:
  void line(std::size_t depth, std::string_view text) {
    _out.append(depth, '\t');
    _out += text;
    _out += '\n';
  }

  void putText(std::size_t depth, std::string_view element, std::string_view text) {
    _out.append(depth, '\t');
    fmt::format_to(std::back_inserter(_out), "<{}>", element);
    for (std::size_t i = 0; i < text.size();) {
      const UTF8Character character = characterAt(text, i);
      const std::size_t length = character.length == 0 ? 1 : character.length;
      if (!isWritable(character)) {
        appendUTF8(_out, 0xFFFD);
      } else {
        putCharacter(text.substr(i, length));
      }
      i += length;
    }
    fmt::format_to(std::back_inserter(_out), "</{}>\n", element);
  }

  void putCharacter(std::string_view bytes) {
    switch (bytes[0]) {
      case '&':
        _out += "&amp;";
        break;
      case '<':
        _out += "&lt;";
        break;
      case '>':
        _out += "&gt;";
        break;
      case '\r':  // a reader would replace a bare one by a line feed
        _out += "&#13;";
        break;
      default:
        _out += bytes;
    }
  }

  std::string& _out;
};

}  // namespace

std::string writeXMLPropertyList(const Value& value) {
  std::string out = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
  Writer(out).put(value, 0);
  out += "</plist>\n";
  return out;
}

}  // namespace veltrad::formats
