// SPDX-License-Identifier: Apache-2.0
// Writes and reads the file of a post in the spool.
#include "support/spool_entry.h"

#include <cstring>

#include "base/property_list.h"
#include "base/text.h"
#include "platform/uuid.h"
#include "support/history_file.h"

namespace veltrad::support {

namespace {

constexpr std::string_view kSpoolVersion = "vspool1\n";
constexpr std::size_t kChecksumBytes = 4;
constexpr std::size_t kMostEntryBytes = 64u << 20;
constexpr PropertyListLimits kEntryLimits{kMostEntryBytes, 8, 65'536, kMostEntryBytes};

Array pairsOf(const std::vector<std::pair<std::string, std::string>>& headers) {
  Array pairs;
  for (const auto& [name, value] : headers) pairs.push_back(Array{Value(name), Value(value)});
  return pairs;
}

bool takeHeaders(const Dictionary& from, SpoolEntry& entry) {
  const Array* pairs = from.array("headers");
  if (!pairs) return false;
  for (const Value& one : *pairs) {
    const Array* pair = one.asArray();
    if (!pair || pair->size() != 2 || !(*pair)[0].asString() || !(*pair)[1].asString()) return false;
    entry.headers.emplace_back(*(*pair)[0].asString(), *(*pair)[1].asString());
  }
  return true;
}

std::uint64_t numberIn(const Dictionary& from, const char* key) {
  const Value* value = from.find(key);
  return value ? static_cast<std::uint64_t>(value->toInt64().value_or(0)) : 0;
}

}  // namespace

PostID newPostID() {
  return platform::randomUUID();
}

std::string textOf(const PostID& id) {
  return hex({reinterpret_cast<const char*>(id.data()), id.size()});
}

std::optional<PostID> postIDOf(std::string_view text) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  PostID id{};
  if (text.size() != 2 * id.size()) return std::nullopt;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const std::size_t digit = kDigits.find(text[i]);
    if (digit == std::string_view::npos) return std::nullopt;
    id[i / 2] = static_cast<unsigned char>(unsigned{id[i / 2]} << 4 | static_cast<unsigned>(digit));
  }
  return id;
}

std::string SpoolEntry::text(const char* key) const {
  const std::string* value = client.string(key);
  if (!value) value = about.string(key);
  return value ? *value : std::string();
}

std::string writeSpoolEntry(const SpoolEntry& entry) {
  std::string file(kSpoolVersion);
  appendBinaryPropertyList(Dictionary{{"id", Data{std::string(entry.id.begin(), entry.id.end())}},
                                      {"order", entry.order},
                                      {"url", entry.url},
                                      {"headers", pairsOf(entry.headers)},
                                      {"body", Data{entry.body}},
                                      {"events", entry.events},
                                      {"uid", entry.uid},
                                      {"connection", entry.connection},
                                      {"asksEntry", entry.asksEntry},
                                      {"client", entry.client},
                                      {"about", entry.about},
                                      {"namesHidden", entry.namesHidden},
                                      {"tries", unsigned{entry.tries}},
                                      {"lastError", entry.lastError}},
                           file);
  return file + historyChecksum(historyCRC(0, file));
}

std::optional<SpoolEntry> readSpoolEntry(std::string_view file) {
  if (!file.starts_with(kSpoolVersion) || file.size() < kSpoolVersion.size() + kChecksumBytes)
    return std::nullopt;
  const std::string_view checked = file.substr(0, file.size() - kChecksumBytes);
  if (historyChecksum(historyCRC(0, checked)) != file.substr(checked.size())) return std::nullopt;
  return readSpoolContent(checked.substr(kSpoolVersion.size()));
}

std::optional<SpoolEntry> readSpoolContent(std::string_view content) {
  const auto parsed = parseBinaryPropertyList(content, kEntryLimits);
  const Dictionary* all = parsed ? parsed.value().asDictionary() : nullptr;
  if (!all) return std::nullopt;
  const Value* id = all->find("id");
  const Value* body = all->find("body");
  const std::string* url = all->string("url");
  const Dictionary* client = all->dictionary("client");
  const Dictionary* about = all->dictionary("about");
  SpoolEntry entry;
  if (!id || !id->asData() || id->asData()->bytes.size() != entry.id.size() || !body || !body->asData() ||
      !url || !url->starts_with("https://") || !client || !about || !takeHeaders(*all, entry))
    return std::nullopt;
  std::memcpy(entry.id.data(), id->asData()->bytes.data(), entry.id.size());
  entry.order = numberIn(*all, "order");
  entry.url = *url;
  entry.body = body->asData()->bytes;
  entry.events = static_cast<std::uint32_t>(numberIn(*all, "events"));
  entry.uid = static_cast<std::uint32_t>(numberIn(*all, "uid"));
  entry.connection = static_cast<std::uint32_t>(numberIn(*all, "connection"));
  // Missing values get the more restrictive default.
  entry.asksEntry = all->boolean("asksEntry").value_or(true);
  entry.client = *client;
  entry.about = *about;
  entry.namesHidden = all->boolean("namesHidden").value_or(true);
  entry.tries = static_cast<std::uint16_t>(numberIn(*all, "tries"));
  if (const std::string* error = all->string("lastError")) entry.lastError = *error;
  return entry;
}

}  // namespace veltrad::support
