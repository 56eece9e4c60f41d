// SPDX-License-Identifier: Apache-2.0
// Finds out the form of a file, parses it, and says where and why it cannot be parsed.
#include "storebag/document.h"

#include <fmt/format.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "config/storebag_container.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "platform/file_store.h"

namespace veltrad::storebag {
namespace {

constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";

bool startsLikeJSON(std::string_view bytes) {
  if (bytes.starts_with(kByteOrderMark)) bytes.remove_prefix(kByteOrderMark.size());
  const std::string_view text = trimmed(bytes);
  return !text.empty() && std::string_view("{[/").find(text.front()) != std::string_view::npos;
}

Result<std::string, std::string> readStandardInput() {
  std::string bytes;
  char piece[1 << 16];
  for (;;) {
    const ssize_t got = ::read(STDIN_FILENO, piece, sizeof piece);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return Failure{fmt::format("standard input: {}", std::strerror(errno))};
    if (got == 0) return bytes;
    bytes.append(piece, static_cast<std::size_t>(got));
    if (bytes.size() > PropertyListLimits{}.bytes)
      return Failure{fmt::format("standard input: more than {} bytes", PropertyListLimits{}.bytes)};
  }
}

// How the mistake at a byte of a JSON text is mended.
std::string mendOfJSON(std::string_view text, const formats::JSONError& error) {
  const auto says = [&](std::string_view words) { return error.detail.find(words) != std::string::npos; };
  const std::size_t offset = std::min(error.offset, text.size());
  const std::string_view before = trimmed(text.substr(0, offset));
  const char here = offset < text.size() ? text[offset] : '\0';
  if (text.starts_with(kByteOrderMark)) return "Save the file without a byte order mark.";
  if ((here == '}' || here == ']') && before.ends_with(','))
    return fmt::format("Take out the comma before the \"{}\".", here);
  if (here == '\'') return "Put keys and texts into double quotes.";
  if (here == '#') return "A comment begins with //.";
  if (offset >= text.size()) return "The text breaks off: close every quotation mark, bracket and brace.";
  if (says("name for object member")) return "Put the key into double quotes.";
  if (says("object member") && says("comma"))
    return "Put a comma after the entry before it, or close the object with }.";
  if (says("comma")) return "Put a comma after the element before it, or close the array with ].";
  if (says("colon")) return "Put a colon between key and value.";
  if (says("followed by other") || says("more text")) return "Take out what follows the last }.";
  if (says("null")) return "Leave the element out.";
  return "Write a text in double quotes, a number, true, false, an object or an array.";
}

}  // namespace

std::string DocumentFailure::line() const {
  if (!place) return detail;
  return fmt::format("{}:{}:{}: {}. {}", file, place->line, place->column, detail, mend);
}

Result<std::string, std::string> readBytes(const std::string& file) {
  if (file == "-") return readStandardInput();
  auto bytes = platform::DiskFileStore().read(file, PropertyListLimits{}.bytes);
  if (!bytes) return Failure{bytes.error().description};
  return std::move(bytes).value();
}

// Limits are those of the readers. sign() checks those of the daemon.
Result<Document, DocumentFailure> documentOf(std::string file, std::string bytes) {
  Document document{std::move(file), std::move(bytes), Document::Form::json, false, {}};
  const auto fails = [&](TextPlace place, std::string detail, std::string mend) {
    while (detail.ends_with('.')) detail.pop_back();
    return Failure{DocumentFailure{document.file, place, std::move(detail), std::move(mend)}};
  };
  if (startsLikeJSON(document.bytes)) {
    auto json = formats::parseJSONWithComments(document.bytes);
    if (!json)
      return fails(placeInText(document.bytes, json.error().offset), json.error().detail,
                   mendOfJSON(document.bytes, json.error()));
    document.content = std::move(json).value();
    document.places = formats::placesInJSON(document.bytes);
    return document;
  }
  auto list = formats::parsePropertyList(document.bytes);
  if (!list && list.error().kind == PropertyListError::Kind::notAPropertyList)
    return fails({}, "neither a property list nor JSON",
                 "A storebag begins with {, or with <?xml as a property list.");
  if (!list)
    return fails(list.error().place.value_or(TextPlace{}), list.error().detail,
                 "A property list has <key> and value in turn, and every element is closed.");
  document.content = std::move(list).value();
  document.form = document.bytes.starts_with("bplist") ? Document::Form::binaryList : Document::Form::xmlList;
  if (document.form == Document::Form::xmlList)
    document.places = formats::placesInXMLPropertyList(document.bytes);
  return document;
}

Result<Document, DocumentFailure> readDocument(const std::string& file) {
  auto bytes = readBytes(file);
  if (!bytes) return Failure{DocumentFailure{file, std::nullopt, bytes.error(), {}}};
  return documentOf(file, std::move(bytes).value());
}

Result<StorebagDocument, DocumentFailure> readStorebag(const std::string& file) {
  auto bytes = readBytes(file);
  if (!bytes) return Failure{DocumentFailure{file, std::nullopt, bytes.error(), {}}};
  return storebagOf(file, std::move(bytes).value());
}

Result<StorebagDocument, DocumentFailure> storebagOf(const std::string& file, std::string bytes) {
  auto read = documentOf(file, std::move(bytes));
  if (!read) return Failure{read.error()};
  StorebagDocument bag;
  bag.document = std::move(read).value();
  const auto fails = [&](std::string detail, std::string mend) {
    return Failure{DocumentFailure{file, bag.document.places.place, std::move(detail), std::move(mend)}};
  };
  const Dictionary* content = bag.document.content.asDictionary();
  if (content == nullptr)
    return fails("no dictionary at its top level", "A storebag begins with { and ends with }.");
  bag.storebag = *content;
  // A storebag has no text named "bag", so this is a container.
  const std::string* text = content->string("bag");
  if (text == nullptr) return bag;
  bag.signedContainer = true;
  bag.moreSignatures = content->array("signatures") != nullptr;
  bag.document.places = {};
  const auto decoded = config::decodeStorebagContainer({std::string(), *text});
  if (!decoded) return fails("\"bag\" is no base64", "Sign the storebag anew.");
  const auto inner = config::parseStorebagBag(decoded->bag);
  if (!inner)
    return fails("the bag is no property list of a dictionary within " + boundsOfStorebags(),
                 "Sign the storebag anew.");
  bag.storebag = *inner;
  return bag;
}

std::string boundsOfStorebags() {
  return fmt::format("at most {} bytes, {} levels and {} values", config::kStorebagBagLimits.bytes,
                     config::kStorebagBagLimits.depth, config::kStorebagBagLimits.objects);
}

}  // namespace veltrad::storebag
