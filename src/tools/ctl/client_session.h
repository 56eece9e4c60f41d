// SPDX-License-Identifier: Apache-2.0
// A session with the daemon, through the C interface. Used by one thread.
#pragma once

#include <chrono>
#include <functional>
#include <optional>
#include <string>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "tools/ctl/answers.h"
#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"
#include "veltra/veltra.h"

namespace veltrad::ctl {

// Makes one call at a time and waits for its answer. Copies come on the library's thread, in order with the
// answers. A call that returns nothing was interrupted; then only close() may follow. The interrupt must
// outlive it.
class ClientSession {
 public:
  using CopyHandler = std::function<void(const AggregatedCopy&)>;
  // The session aggregates if there is a handler.
  explicit ClientSession(Interrupt& interrupt, CopyHandler aggregated = nullptr);
  ~ClientSession();

  // Connects. Returns a text that says what is wrong, if anything is. Without a root uses the environment's.
  // Without an identity only sendOneShot() calls may follow.
  std::optional<std::string> open(const std::optional<std::string>& root,
                                  const std::optional<Identity>& identity);

  std::optional<Answer> start();
  // `message` has "category", "type", "payload" and "flag".
  std::optional<Answer> send(const Dictionary& message);
  std::optional<Answer> send(std::uint16_t category, std::uint16_t type,
                             const std::optional<Dictionary>& payload, std::uint32_t flag);
  std::optional<Answer> sendOneShot(const Identity& who, std::uint16_t category, std::uint16_t type,
                                    const std::optional<Dictionary>& payload);
  std::optional<Answer> flush();
  std::optional<Answer> states(const std::optional<Dictionary>& userInfo);
  std::optional<Answer> displayURL();
  // Called twice a second with the time that has passed, and at the end with nothing.
  using Progress = std::function<void(std::optional<std::chrono::seconds>)>;
  std::optional<Answer> uploadFile(const std::string& path, const Progress& progress = nullptr);
  std::optional<Answer> uploadLogData(const Array& data);
  std::optional<Answer> finish();

  // Waits for at most 2 s. Returns how many calls were lost unsent.
  std::uint64_t close();

 private:
  using Call = std::function<veltra_status(veltra_session*, veltra_callback, void*)>;
  std::optional<Answer> await(const Call& call, const Progress& progress = nullptr);
  // Called on the library's thread.
  bool lostForLong();
  static void stateChanged(void* context, veltra_connection_state state, const veltra_value* backends,
                           const char* why);
  static void answered(void* context, const veltra_reply* reply);
  static void aggregated(void* context, const veltra_value* sessionInfo, double timestamp,
                         std::uint16_t category, std::uint16_t type, const veltra_value* payload);

  Interrupt& _interrupt;
  const CopyHandler _aggregated;
  const FileDescriptor _arrived;
  veltra_session* _session = nullptr;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<Answer> _answer GUARDED_BY(_mutex);
  // Since when there is no connection; absent if there is one.
  std::optional<std::chrono::steady_clock::time_point> _lost GUARDED_BY(_mutex);
};

}  // namespace veltrad::ctl
