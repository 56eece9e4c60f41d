// SPDX-License-Identifier: Apache-2.0
// Maps the file of counts, and computes the losses of the previous process.
#include "platform/counts_record.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

#include "base/file_descriptor.h"
#include "formats/json.h"
#include "platform/file_store.h"

namespace veltrad::platform {

namespace {

// Differs between programs with different tables of reasons, so that none reads the numbers of another.
constexpr std::uint64_t fingerprint() {
  std::uint64_t hash = 0xcbf29ce484222325;
  for (const wire::ReasonEntry& entry : wire::kReasons) {
    for (const char c : entry.name) hash = (hash ^ static_cast<unsigned char>(c)) * 0x100000001b3;
    hash = (hash ^ '\n') * 0x100000001b3;
  }
  return hash;
}

// Whether the count is of messages or events that did not arrive.
bool saysLoss(const wire::ReasonEntry& entry) {
  const bool counted = entry.concern == "event" || entry.concern == "message";
  const std::string_view what = counted ? entry.text.substr(entry.concern.size()) : std::string_view();
  return what.starts_with(" lost") || what.starts_with(" dropped");
}

// Whether the reason settles an event that a back end has accepted.
bool settles(wire::Reason reason) {
  switch (reason) {
    case wire::Reason::backend_disabled:  // not taken in
    case wire::Reason::daemon_ended:
    case wire::Reason::client_does_not_read:  // of copies for a client
    case wire::Reason::client_gone:
    case wire::Reason::frame_too_large:
      return false;
    default:
      return reason == wire::Reason::event_posted || reason == wire::Reason::kept_in_spool ||
             (wire::entryOf(reason).concern == "event" && saysLoss(wire::entryOf(reason)));
  }
}

std::uint64_t missing(std::uint64_t from, std::uint64_t taken) {
  return from > taken ? from - taken : 0;
}

// The counts of that process in the counters file; none if it was not the last to write it.
Dictionary toldBy(std::int64_t pid, double startedAt, FileStore& files, const std::string& countersPath) {
  const auto text = files.read(countersPath, 1u << 20);
  const auto parsed = text ? formats::parseJSON(text.value()) : Failure{formats::JSONError{}};
  const Dictionary* all = parsed ? parsed.value().asDictionary() : nullptr;
  const Value* writer = all ? all->find("pid") : nullptr;
  if (!writer || writer->toInt64() != pid || all->real("started") != startedAt) return {};
  const Dictionary* counts = all->dictionary("counts");
  return counts ? *counts : Dictionary{};
}

std::string failure(const std::string& path, int error) {
  return path + ": " + std::generic_category().message(error);
}

}  // namespace

// The content of the file, in the machine's byte order.
struct CountsRecord::Block {
  std::uint64_t table = fingerprint();
  std::int64_t pid = ::getpid();
  double startedAt = 0;
  std::atomic<bool> told{false};
  Counts counts;
};

Result<CountsRecord, std::string> CountsRecord::open(const std::string& path, FileStore& files,
                                                     const std::string& countersPath, double startedAt) {
  const FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
  struct stat status {};
  if (!file.isOpen() || ::fstat(file.get(), &status) != 0) return Failure{failure(path, errno)};
  // The room is there before it is mapped: a full disk must not end the process later.
  if (!S_ISREG(status.st_mode)) return Failure{failure(path, EINVAL)};
  if (const int error = ::posix_fallocate(file.get(), 0, sizeof(Block))) return Failure{failure(path, error)};
  void* place = ::mmap(nullptr, sizeof(Block), PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
  if (place == MAP_FAILED) return Failure{failure(path, errno)};
  CountsRecord record(static_cast<Block*>(place));
  Block fresh;
  fresh.startedAt = startedAt;
  const bool readable = record._block->table == fresh.table;
  fresh.counts.ofReason[static_cast<std::size_t>(wire::Reason::daemon_ended)] =
      readable ? lostBy(*record._block, files, countersPath) : 0;
  if (readable) fresh.counts.day = record._block->counts.day;
  // One write, so that a kill leaves either the old or the new numbers.
  if (::pwrite(file.get(), static_cast<const void*>(&fresh), sizeof fresh, 0) != sizeof fresh) {
    return Failure{failure(path, errno)};
  }
  return record;
}

std::uint64_t CountsRecord::lostBy(const Block& before, FileStore& files, const std::string& countersPath) {
  const Dictionary told =
      before.told ? Dictionary{} : toldBy(before.pid, before.startedAt, files, countersPath);
  std::uint64_t settled = 0;
  std::uint64_t untold = 0;
  for (std::size_t i = 0; i < wire::kReasonCount; ++i) {
    const std::uint64_t count = before.counts.ofReason[i];
    if (settles(static_cast<wire::Reason>(i))) settled += count;
    if (before.told || !saysLoss(wire::kReasons[i])) continue;
    const Value* known = told.find(wire::kReasons[i].text);
    const auto shown = known ? known->toInt64().value_or(0) : 0;
    untold += missing(count, static_cast<std::uint64_t>(std::max<std::int64_t>(shown, 0)));
  }
  return untold + missing(before.counts.eventsTaken, settled);
}

CountsRecord::CountsRecord(CountsRecord&& other) noexcept : _block(std::exchange(other._block, nullptr)) {}

CountsRecord::~CountsRecord() {
  if (_block) ::munmap(_block, sizeof(Block));
}

Counts& CountsRecord::counts() {
  return _block->counts;
}

void CountsRecord::told() {
  _block->told = true;
}

}  // namespace veltrad::platform
