// SPDX-License-Identifier: Apache-2.0
// Chooses the form of a settings file and parses it. Its owner locks.
#include "platform/local_settings.h"

#include <fmt/format.h>

#include "base/text.h"
#include "formats/json.h"
#include "formats/places.h"
#include "formats/property_list.h"

namespace veltrad::platform {

namespace {

std::string withoutSuffix(const std::string& path) {
  for (const std::string_view suffix : {".json", ".plist"})
    if (path.ends_with(suffix)) return path.substr(0, path.size() - suffix.size());
  return path;
}

std::string placeText(const std::string& path, TextPlace place) {
  return fmt::format("{}:{}:{}", path, place.line, place.column);
}

void parse(LocalContent& content, bool isJSON) {
  const auto broken = [&](TextPlace place, const std::string& detail) {
    content.kind = LocalContent::Kind::broken;
    content.error = placeText(content.path, place) + ": " + detail;
  };
  content.kind = LocalContent::Kind::good;
  if (isJSON) {
    auto value = formats::parseJSONWithComments(content.bytes);
    if (!value) return broken(placeInText(content.bytes, value.error().offset), value.error().detail);
    content.value = std::move(value).value();
  } else {
    auto value = formats::parsePropertyList(content.bytes);
    if (!value) return broken(value.error().place.value_or(TextPlace{}), value.error().detail);
    content.value = std::move(value).value();
  }
}

bool sayTheSame(const LocalContent& a, const LocalContent& b) {
  return a.kind == b.kind && a.path == b.path && a.bytes == b.bytes && a.error == b.error &&
         a.warning == b.warning;
}

}  // namespace

std::string LocalContent::placeOf(const std::vector<std::string>& keys) const {
  if (keys.empty()) return placeText(path, {});
  if (bytes.starts_with("bplist")) return path;
  const formats::Places places =
      path.ends_with(".json") ? formats::placesInJSON(bytes) : formats::placesInXMLPropertyList(bytes);
  const auto place = places.at(keys);
  return place ? placeText(path, *place) : path;
}

LocalSettings::LocalSettings(FileStore& files, const std::string& path)
    : _files(files), _jsonPath(withoutSuffix(path) + ".json"), _listPath(withoutSuffix(path) + ".plist") {}

Result<std::shared_ptr<const LocalContent>, FileFailure> LocalSettings::content() {
  // The stamps come first: a file that changes while it is read is read again.
  const auto json = _files.stamp(_jsonPath);
  if (!json) return Failure{json.error()};
  const auto list = _files.stamp(_listPath);
  if (!list) return Failure{list.error()};
  const std::pair stamps{json.value(), list.value()};
  if (_stamps == stamps) return _content;
  auto fresh = read();
  if (!fresh) return Failure{fresh.error()};
  LocalContent& now = fresh.value();
  if (now.path == _jsonPath && list.value())
    now.warning = _jsonPath + " and " + _listPath + ": both are there, the first counts";
  if (!_content || !sayTheSame(*_content, now))
    _content = std::make_shared<const LocalContent>(std::move(fresh).value());
  _stamps = stamps;  // last, so that what there was no memory for is read again
  return _content;
}

Result<LocalContent, FileFailure> LocalSettings::read() {
  for (const std::string& path : {_jsonPath, _listPath}) {
    LocalContent content;
    content.path = path;
    auto bytes = _files.read(path);
    if (bytes) {
      content.bytes = std::move(bytes).value();
      parse(content, path == _jsonPath);
      return content;
    }
    if (bytes.error().passes()) return Failure{bytes.error()};
    if (bytes.error().kind == FileFailure::Kind::notFound) continue;
    content.kind = LocalContent::Kind::broken;
    content.error = bytes.error().description;
    return content;
  }
  return LocalContent();
}

}  // namespace veltrad::platform
