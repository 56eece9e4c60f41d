// SPDX-License-Identifier: Apache-2.0
// Appends events to the energy log's file.
#include "backends/ampery/energy_log.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>
#include <utility>

#include "base/file_descriptor.h"
#include "formats/json.h"
#include "platform/log.h"

namespace veltrad::backends {

bool EnergyLog::logRegisteredEvent(std::uint32_t client, const std::string& name, const Dictionary& event) {
  const Dictionary line{{"client", client},
                        {"name", name},
                        {"time", platform::timevalToSeconds(_clock.now())},
                        {"event", event}};
  const std::string text = formats::writeJSON(line) + "\n";
  std::optional<std::string> failure;
  std::uint64_t lostBefore = 0;
  {
    const Lock held(_mutex);
    failure = append(text);
    lostBefore = std::exchange(_lost, failure ? _lost + 1 : 0);
  }
  _counters.count(failure ? wire::Reason::energy_log_failed : wire::Reason::energy_written);
  if (failure && lostBefore == 0) {
    logError("logRegisteredEvent: The energy log cannot be written, events are lost: %s", failure->c_str());
  } else if (!failure && lostBefore > 0) {
    logInfo("logRegisteredEvent: The energy log is written again after %llu lost events",
            static_cast<unsigned long long>(lostBefore));
  }
  return !failure;
}

std::optional<std::string> EnergyLog::append(std::string_view line) const {
  const auto failed = [&] { return _path + ": " + std::generic_category().message(errno); };
  // O_NONBLOCK: opening a pipe of that name must not block the caller.
  const FileDescriptor file(::open(
      _path.c_str(), O_RDWR | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, 0640));
  if (!file.isOpen()) return failed();
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return failed();
  if (!S_ISREG(status.st_mode)) return _path + ": not a regular file";
  // A daemon that was killed may have left an incomplete line.
  char last = '\n';
  if (status.st_size > 0 && ::pread(file.get(), &last, 1, status.st_size - 1) < 0) return failed();
  const std::string text = (last == '\n' ? "" : "\n") + std::string(line);
  const ssize_t written = ::write(file.get(), text.data(), text.size());
  if (written < 0) return failed();
  if (written == static_cast<ssize_t>(text.size())) return std::nullopt;
  // The disk is full: remove the part of the line that was written.
  const off_t end = ::lseek(file.get(), 0, SEEK_CUR);
  if (end < written || ::ftruncate(file.get(), end - written) != 0) return failed();
  return _path + ": no room for " + std::to_string(line.size()) + " bytes";
}

}  // namespace veltrad::backends
