// SPDX-License-Identifier: Apache-2.0
// Records what leaves.
#include "support/history.h"

#include <fmt/format.h>
#include <openssl/evp.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <new>

#include "base/text.h"
#include "formats/json.h"
#include "platform/clock.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::support {

namespace {

constexpr std::size_t kMostJobBytes = 4096;
constexpr std::int64_t kDaySeconds = 86'400;
constexpr std::size_t kDigestPiece = 64u << 10;
constexpr const char* kNoMemory = "no memory";

// The digest of a file or of a text; absent if the file cannot be read.
std::optional<std::string> digestOf(std::string_view bytes, const FileDescriptor* file,
                                    std::uint64_t fileBytes) {
  const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned length = 0;
  bool good = context && EVP_DigestInit_ex(context.get(), EVP_sha256(), nullptr) == 1 &&
              EVP_DigestUpdate(context.get(), bytes.data(), bytes.size()) == 1;
  std::string piece(file ? kDigestPiece : 0, '\0');
  for (std::uint64_t at = 0; good && file && at < fileBytes;) {
    const std::size_t most = std::min<std::uint64_t>(piece.size(), fileBytes - at);
    const ssize_t got = ::pread(file->get(), piece.data(), most, static_cast<off_t>(at));
    good = got > 0 && EVP_DigestUpdate(context.get(), piece.data(), static_cast<std::size_t>(got)) == 1;
    at += static_cast<std::uint64_t>(std::max<ssize_t>(got, 0));
  }
  if (!good || EVP_DigestFinal_ex(context.get(), digest, &length) != 1) return std::nullopt;
  return hex({reinterpret_cast<const char*>(digest), length});
}

// On the disk writer's thread: a file may be large.
void putDigest(HistoryRecord& record) {
  auto parsed = formats::parseJSON(record.header);
  Dictionary header = *parsed.value().asDictionary();
  header.setIfPresent("sha256", digestOf(record.body, record.file.get(), record.bodyBytes));
  header.set("kept", false);
  record.header = formats::writeJSON(header);
  std::string().swap(record.body);  // it may have to wait for the disk
  record.file.reset();
  record.digestAlone = false;
}

std::size_t waitingBytes(const HistoryRecords& records) {
  std::size_t bytes = 0;
  for (const HistoryRecord& record : records) bytes += record.waitingBytes();
  return bytes;
}

std::string idOf(std::uint64_t number) {
  return fmt::format("{:x}", number);
}

std::int64_t dayOf(std::uint64_t number) {
  return static_cast<std::int64_t>(number / 1'000'000) / kDaySeconds;
}

}  // namespace

History::History(const platform::Clock& clock, std::string directory, platform::DiskWriter& writer)
    : _clock(clock), _directory(std::move(directory)), _folder(_directory), _queue(writer, kMostJobBytes) {}

void History::keep(std::optional<HistorySpace> space) {
  const Lock held(_mutex);
  _keeps.store(space.has_value(), std::memory_order_relaxed);
  if (!space) return;
  _space = *space;
  _trimmedOn = 0;
}

// Microseconds since 1970, each number once.
std::uint64_t History::nextNumber() {
  const platform::TimeValue now = _clock.now();
  const auto time = static_cast<std::uint64_t>(now.seconds * 1'000'000 + now.microseconds);
  const Lock held(_mutex);
  return _lastNumber = std::max(time, _lastNumber + 1);
}

std::uint64_t History::begins(Dictionary header, const Body& body) {
  if (!keeps()) return 0;
  const std::uint64_t number = nextNumber();
  header.set("id", idOf(number));
  header.set("time", static_cast<double>(number) / 1e6);
  HistoryRecord record;
  record.day = dayOf(number);
  record.body = body.bytes;
  record.file = body.file;
  record.bodyBytes = body.file ? body.fileBytes : body.bytes.size();
  {
    const Lock held(_mutex);
    record.digestAlone = record.bodyBytes > _space.bytes / kLargestShare;
  }
  record.header = formats::writeJSON(header);
  put(std::move(record));
  return number;
}

void History::ended(std::uint64_t number, Dictionary end) {
  if (!keeps()) return;
  end.set("end", idOf(number));
  HistoryRecord record;
  record.day = dayOf(nextNumber());
  record.header = formats::writeJSON(end);
  put(std::move(record));
}

void History::put(HistoryRecord record) {
  const std::size_t bytes = record.waitingBytes();
  std::size_t all = 0;
  {
    const Lock held(_mutex);
    _waiting.push_back(std::move(record));
    all = _waitingBytes.fetch_add(bytes, std::memory_order_relaxed) + bytes;
  }
  if (all > kMostBytes / 2) writeSoon();
}

void History::mend() {
  static_cast<void>(_queue.put(
      [this] {
        static_cast<void>(platform::removeUnfinishedFiles(_directory));
        if (const std::uint64_t cut = _folder.mend())
          logWarning("The history of what left: %llu bytes of an unfinished record were cut off",
                     static_cast<unsigned long long>(cut));
      },
      1));
}

void History::writeSoon() {
  const std::int64_t today = _clock.now().seconds / kDaySeconds;
  {
    const Lock held(_mutex);
    if (_waiting.empty() && (!keeps() || _trimmedOn == today)) return;
  }
  if (_asked.exchange(true)) return;
  if (_queue.put([this] { write(); }, 1) != platform::DiskWriter::Queue::Put::taken) _asked = false;
}

void History::write() {
  _asked = false;
  HistoryRecords records;
  HistorySpace space;
  {
    const Lock held(_mutex);
    records.swap(_waiting);
    space = _space;
  }
  const std::size_t before = waitingBytes(records);
  std::string error;
  try {
    for (HistoryRecord& record : records) {
      if (record.digestAlone) putDigest(record);
    }
    _folder.append(records, error);
  } catch (const std::bad_alloc&) {
    error = kNoMemory;
  }
  {
    const Lock held(_mutex);
    _waitingBytes.fetch_sub(before - waitingBytes(records), std::memory_order_relaxed);
    _waiting.splice(_waiting.begin(), records);
  }
  if (!error.empty() && !_failed)
    logError("The history of what left could not be written, and nothing more leaves: %s", error.c_str());
  _failed = !error.empty();
  const std::int64_t today = _clock.now().seconds / kDaySeconds;
  if (keeps()) _folder.trim(space, today);
  const Lock held(_mutex);
  _trimmedOn = today;
}

bool History::writeNow(std::chrono::steady_clock::time_point deadline) {
  // What it leaves for lack of memory waits for the next time, and nobody for this one.
  return _queue.run([this] { write(); }, deadline);
}

std::optional<HistoryFolder::Removed> History::purge(std::chrono::steady_clock::time_point deadline) {
  const auto removed = std::make_shared<std::optional<HistoryFolder::Removed>>();
  const auto purge = [this, removed] {
    write();
    *removed = _folder.purge();
  };
  return _queue.run(purge, deadline) ? *removed : std::nullopt;
}

}  // namespace veltrad::support
