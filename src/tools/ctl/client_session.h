// One session with the daemon, through the C interface. Own thread only.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "tools/ctl/answers.h"
#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"
#include "veltra/veltra.h"

namespace veltrad::ctl {

// One call at a time, each waited for; copies come on the library's thread, in order among the answers. A
// call that gives nothing was interrupted: then only close() makes sense. The interrupt must outlive it.
class ClientSession {
 public:
  using CopyHandler = std::function<void(const AggregatedCopy&)>;
  // With a handler the session aggregates.
  explicit ClientSession(Interrupt& interrupt, CopyHandler aggregated = nullptr);
  ~ClientSession();
  ClientSession(const ClientSession&) = delete;
  ClientSession& operator=(const ClientSession&) = delete;

  // Connects. Nothing: done; else a text that says what is wrong and what to do. No root: the environment's.
  std::optional<std::string> open(const std::optional<std::string>& root, const Identity& identity);
  // The same for a session that says nothing of itself: for sendOneShot().
  std::optional<std::string> openUndescribed(const std::optional<std::string>& root);

  std::optional<Answer> start();
  // "category", "type", "payload" and "flag" as they are.
  std::optional<Answer> send(const Dictionary& message);
  std::optional<Answer> send(std::uint16_t category, std::uint16_t type,
                             const std::optional<Dictionary>& payload, std::uint32_t flag);
  std::optional<Answer> sendOneShot(const Identity& who, std::uint16_t category, std::uint16_t type,
                                    const std::optional<Dictionary>& payload);
  std::optional<Answer> flush();
  std::optional<Answer> states(const std::optional<Dictionary>& userInfo);
  std::optional<Answer> displayURL();
  // While it is waited for, `progress` (when there is one) gets the time that has passed, twice a second, and
  // nothing at the end.
  using Progress = std::function<void(std::optional<std::chrono::seconds>)>;
  std::optional<Answer> uploadFile(const std::string& path, const Progress& progress = nullptr);
  std::optional<Answer> uploadLogData(const Array& data);
  std::optional<Answer> finish();

  // Waits for at most 2 s. Returns how many calls were lost unwritten.
  std::uint64_t close();

 private:
  using Call = std::function<veltra_status(veltra_callback, void*)>;
  std::optional<std::string> create(veltra_session_options& options, const std::optional<std::string>& root);
  std::optional<Answer> await(const Call& call, const Progress& progress = nullptr);
  // Both on the library's thread.
  static void answered(void* context, const veltra_reply* reply);
  static void aggregated(void* context, const veltra_value* sessionInfo, double timestamp,
                         std::uint16_t category, std::uint16_t type, const veltra_value* payload);

  // Constant after construction.
  Interrupt& _interrupt;
  const CopyHandler _aggregated;
  const FileDescriptor _arrived;  // an event descriptor
  // Own thread only.
  veltra_session* _session = nullptr;
  // Guarded by _mutex.
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<Answer> _answer GUARDED_BY(_mutex);
};

}  // namespace veltrad::ctl
