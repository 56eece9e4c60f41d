// SPDX-License-Identifier: Apache-2.0
// Files of storebags. Any thread; one at a time for a name.
#include "config/storebag_store.h"

#include "base/property_list.h"
#include "config/storebag_container.h"
#include "platform/clock.h"
#include "platform/log.h"

namespace veltrad::config {
namespace {

constexpr std::size_t kMostStoredBytes = kStorebagMostContainerBytes + 65'536;  // room for the keys beside it

std::optional<KeptStorebag> keptIn(const std::string& bytes) {
  const auto list = parseBinaryPropertyList(bytes);
  const Dictionary* keys = list ? list.value().asDictionary() : nullptr;
  const Value* container = keys ? keys->find("container") : nullptr;
  const auto maxAge = keys ? keys->int32("maxAge") : std::nullopt;
  const Value* fetchTime = keys ? keys->find("fetchTime") : nullptr;
  if (!container || !container->asData() || !maxAge || !fetchTime || !fetchTime->asReal())
    return std::nullopt;
  KeptStorebag kept{container->asData()->bytes, std::nullopt, *maxAge, *fetchTime->asReal()};
  if (const std::string* text = keys->string("lastModified")) kept.lastModified = *text;
  return kept;
}

}  // namespace

bool StorebagStore::holds(const std::string& name) {
  const auto stamp = _files.stamp(pathOf(name));
  return stamp && stamp.value();
}

Result<std::optional<KeptStorebag>, platform::FileFailure> StorebagStore::read(const std::string& name) {
  const auto bytes = _files.read(pathOf(name), kMostStoredBytes);
  if (!bytes) {
    if (bytes.error().passes()) return Failure{bytes.error()};
    if (bytes.error().kind != platform::FileFailure::Kind::notFound) remove(name, bytes.error().description);
    return std::optional<KeptStorebag>();
  }
  auto kept = keptIn(bytes.value());
  if (!kept) remove(name, "no storebag as this daemon keeps them");
  return kept;
}

void StorebagStore::write(const std::string& name, KeptStorebag storebag) {
  Dictionary keys{{"container", Data{std::move(storebag.container)}},
                  {"maxAge", storebag.maxAge},
                  {"fetchTime", platform::timevalToSeconds(_clock.now())}};
  if (storebag.lastModified) keys.set("lastModified", *storebag.lastModified);
  auto written = platform::makeDirectories(_directory, 0700);
  if (written) written = _files.replace(pathOf(name), writeBinaryPropertyList(keys));
  if (!written)
    logWarning("Storebag '%s' is not kept for the next start: %s", name.c_str(),
               written.error().description.c_str());
}

void StorebagStore::renew(const std::string& name, std::int32_t maxAge) {
  auto kept = read(name);
  if (!kept || !kept.value()) return;
  kept.value()->maxAge = maxAge;
  write(name, std::move(*kept.value()));
}

void StorebagStore::remove(const std::string& name, const std::string& why) {
  const auto removed = _files.unlink(pathOf(name));
  logWarning("Storebag kept in %s is not used and removed: %s%s", pathOf(name).c_str(), why.c_str(),
             removed ? "" : ("; not removed, " + removed.error().description).c_str());
}

}  // namespace veltrad::config
