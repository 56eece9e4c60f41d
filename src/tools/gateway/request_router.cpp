// SPDX-License-Identifier: Apache-2.0
// Decides from a request's head.
#include "gateway/request_router.h"

#include <fmt/format.h>

#include <algorithm>
#include <charconv>
#include <optional>

#include "base/text.h"
#include "gateway/body_handlers.h"
#include "gateway/envelope.h"
#include "gateway/piece_writer.h"

namespace veltrad::gateway {

namespace {

constexpr std::string_view kEventsPath = "/events";
constexpr std::size_t kMostLabelBytes = 32;
constexpr std::size_t kPostIDLength = 32;
// The connection's buffers, and what zlib needs.
constexpr std::uint64_t kOpenBodyBytes = 24u << 10;
constexpr std::uint64_t kUnpackingBytes = 40u << 10;
// Pieces under way, and the next one.
constexpr std::uint64_t kMostFileBytes = (kMostPiecesUnderWay + 1) * kPieceBytes;

bool isLabel(std::string_view text) {
  return !text.empty() && text.size() <= kMostLabelBytes &&
         text.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789-") == std::string_view::npos;
}

bool isPostID(std::string_view text) {
  return text.size() == kPostIDLength && text.find_first_not_of("0123456789abcdef") == std::string_view::npos;
}

// Nothing for a "%" without two digits.
std::optional<std::string> percentDecoded(std::string_view text) {
  std::string plain;
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (text[at] != '%') {
      plain += text[at];
      continue;
    }
    unsigned byte = 0;
    if (at + 3 > text.size()) return std::nullopt;
    const auto read = std::from_chars(text.data() + at + 1, text.data() + at + 3, byte, 16);
    if (read.ec != std::errc() || read.ptr != text.data() + at + 3) return std::nullopt;
    plain += static_cast<char>(byte);
    at += 2;
  }
  return plain;
}

Result<std::map<std::string, std::string>, std::string> parametersIn(std::string_view query) {
  std::map<std::string, std::string> parameters;
  while (!query.empty()) {
    const std::string_view one = query.substr(0, query.find('&'));
    query.remove_prefix(std::min(query.size(), one.size() + 1));
    const std::size_t equals = std::min(one.find('='), one.size());
    auto name = percentDecoded(one.substr(0, equals));
    auto text = percentDecoded(one.substr(std::min(one.size(), equals + 1)));
    if (!name || !text || !isUTF8(*name) || !isUTF8(*text))
      return Failure{std::string("the query is no percent-encoded UTF-8")};
    if (text->size() > kMostIdentifierBytes || text->find('\0') != std::string::npos)
      return Failure{
          fmt::format("the parameter \"{}\" has more than {} bytes, or a NUL", *name, kMostIdentifierBytes)};
    parameters[std::move(*name)] = std::move(*text);
  }
  return parameters;
}

std::string mediaTypeOf(std::string_view field) {
  return lowerCase(trimmed(field.substr(0, field.find(';'))));
}

std::optional<Place> placeOf(std::string_view path) {
  if (path == kEventsPath || path.starts_with("/events/")) return Place::events;
  if (path == "/upload") return Place::upload;
  if (path == "/logdata") return Place::logData;
  return std::nullopt;
}

std::optional<Refusal> faultOfFields(const RequestHead& head, Place place, bool packed,
                                     const BodyBounds& bounds) {
  const char* expected = place == Place::events ? "application/json" : "application/octet-stream";
  const std::string type = mediaTypeOf(head.field("Content-Type"));
  if (!type.empty() && type != expected)
    return Refusal{415, "type", fmt::format("Content-Type: expected {}", expected)};
  const std::string encoding = mediaTypeOf(head.field("Content-Encoding"));
  if (!packed && !encoding.empty() && encoding != "identity")
    return Refusal{415, "encoding", "Content-Encoding: expected gzip or none"};
  if (place == Place::upload && !packed) return Refusal{415, "encoding", "Content-Encoding: expected gzip"};
  const std::uint64_t most = place == Place::events   ? bounds.events
                             : place == Place::upload ? bounds.packedFile
                                                      : bounds.logData;
  if (head.length().value_or(0) > most)
    return Refusal{413, "too_large", fmt::format("a body here has at most {} bytes", most)};
  return std::nullopt;
}

// What a body is charged before its first byte. A file is charged once for all that it will keep.
std::uint64_t firstChargeFor(const ParsedRequest& request) {
  const std::uint64_t open = kOpenBodyBytes + (request.packed ? kUnpackingBytes : 0);
  return request.place == Place::upload
             ? open + std::min(request.length.value_or(kMostFileBytes), kMostFileBytes)
             : open;
}

}  // namespace

Result<ParsedRequest, Refusal> parsedRequest(const RequestHead& head, const BodyBounds& bounds) {
  const std::string_view target = head.target();
  const std::string_view path = target.substr(0, target.find('?'));
  const auto place = placeOf(path);
  ParsedRequest request;
  if (place == Place::events && path.size() > kEventsPath.size())
    request.via = path.substr(kEventsPath.size() + 1);
  if (!place || (path.size() > kEventsPath.size() && *place == Place::events && !isLabel(request.via)))
    return Failure{Refusal{404, "path", "nothing is here"}};
  if (head.method() != "POST") return Failure{Refusal{405, "method", "expected POST"}};
  request.place = *place;
  request.path = path;
  request.length = head.length();
  request.packed = mediaTypeOf(head.field("Content-Encoding")) == "gzip";
  if (auto fault = faultOfFields(head, *place, request.packed, bounds)) return Failure{std::move(*fault)};
  if (isPostID(head.field("X-VLT-Post-ID"))) request.postID = head.field("X-VLT-Post-ID");
  if (*place != Place::upload) return request;
  auto parameters = parametersIn(target.substr(std::min(target.size(), path.size() + 1)));
  if (!parameters) return Failure{Refusal{400, "query", std::move(parameters.error())}};
  request.query = std::move(parameters).value();
  request.path = target;
  std::uint32_t sequence = 0;
  const std::string& text = request.query["sequence"];
  const auto read = std::from_chars(text.data(), text.data() + text.size(), sequence);
  if (text.empty() || read.ec != std::errc() || read.ptr != text.data() + text.size())
    return Failure{Refusal{400, "query", "\"sequence\": expected a number of 32 bits"}};
  return request;
}

std::variant<Answer, std::unique_ptr<BodyHandler>> RequestRouter::request(const RequestHead& head) {
  auto request = parsedRequest(head, _services.bounds);
  if (!request) return _refusals.answer(request.error());
  Charge charge(request.value().place == Place::events ? _events : _others);
  if (!charge.to(firstChargeFor(request.value()))) return _refusals.busy("no_room");
  return handlerFor(_services, std::move(request).value(), std::move(charge));
}

}  // namespace veltrad::gateway
