// VeltraBackend: the base of every reporting backend. Its session's thread configures it, sends and flushes;
// other sessions' threads and the HTTP thread reach its facts, its state and its sampling threshold.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/lock_ranks.h"
#include "backends/session_facts.h"
#include "base/mutex.h"
#include "base/value.h"
#include "platform/clock.h"
#include "wire/error.h"
#include "wire/reasons.h"

namespace veltrad::platform {
class Counters;
class Random;
}  // namespace veltrad::platform

namespace veltrad::backends {

// State of a backend. 2 and 3 count as reporting for the client.
enum BackendState : std::int32_t {
  kBackendWaiting = 0,  // before the first updateState, or user info is required and missing
  kBackendDisabled = 1,
  kBackendReporting = 2,
  kBackendHeld = 3,  // sampled out, but held instead of disabled
};

// A state and why. Aligned so that the two change in one indivisible store.
struct alignas(8) StateVerdict {
  std::int32_t state = kBackendWaiting;
  wire::Reason reason = wire::Reason::waits_for_user_info;
};

// What a back end has to do with its messages just now.
struct BackendActivity {
  std::size_t held = 0;      // events that wait for a flush, datagrams that wait for the socket
  std::size_t underWay = 0;  // posts without an answer, datagrams without an acknowledgement
  std::string lastOutcome;   // of the last post: "HTTP 200", a transport's text; empty: none
};

// Who has a back end made.
struct BackendOwner {
  std::shared_ptr<platform::MemoryAccount> account = nullptr;  // null: nobody pays
  bool oneShot = false;                                        // for one message, not for a session
};

struct NumberedMessage {
  const Dictionary* payload = nullptr;  // null: none
  platform::TimeValue timestamp;
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::uint16_t eventID = 0;
  std::int32_t flag = 0;
};

// One backend of one session. It outlives its session only while work of its own is under way.
class VeltraBackend : public std::enable_shared_from_this<VeltraBackend> {
 public:
  // A result text or none, an error or none; may run on another thread, exactly once.
  using FlushCompletion =
      std::function<void(std::optional<std::string>, std::optional<wire::ReportingError>)>;

  virtual ~VeltraBackend() = default;
  VeltraBackend(const VeltraBackend&) = delete;
  VeltraBackend& operator=(const VeltraBackend&) = delete;

  // Lower-case hexadecimal SHA-256 of the text's UTF-8 bytes, 64 characters.
  static std::string convertIntoSHA256(std::string_view text);

  // Called before the session lets the backend go.
  virtual void cleanup() {}
  virtual void updateState();

  // Numbers the message (1, 2, … 65535, 0, …) and passes it on. The text that comes back says what was sent.
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::int32_t flag);
  virtual std::optional<std::string> sendNumberedMessage(const NumberedMessage& message);
  // The base completes at once with neither text nor error. `completion` may be empty.
  virtual std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion);
  virtual bool uploadFileAtPath(const std::string& path, const std::string& extensionToken);
  virtual bool uploadLogData(const Array& logData);
  virtual void setCorrelatedSessionID(const std::string& sessionID);

  // Constant after construction.
  const std::string& name() const { return _name; }
  const std::string& productFamily() const { return _productFamily; }
  double samplingFactor() const { return _samplingFactor; }  // in [0, 1), drawn once
  const std::optional<std::string>& displayURL() const { return _displayURL; }

  // Any thread, at any time. The facts that a reader has taken stay as they are; never null.
  std::shared_ptr<const SessionFacts> facts() const;
  void setFacts(std::shared_ptr<const SessionFacts> facts);
  void setUserInfoDict(SharedDictionary userInfo);
  std::int32_t state() const { return stateVerdict().state; }
  StateVerdict stateVerdict() const { return _state.load(std::memory_order_relaxed); }
  void setState(StateVerdict verdict) { _state.store(verdict, std::memory_order_relaxed); }
  std::int32_t hierarchy() const { return _hierarchy.load(std::memory_order_relaxed); }
  void setHierarchy(std::int32_t value) { _hierarchy.store(value, std::memory_order_relaxed); }
  std::optional<double> samplingThreshold() const;
  void setSamplingThreshold(std::optional<double> value);
  virtual BackendActivity activity() const;
  // A post begins; it ended so.
  void postBegins() { _postsUnderWay.fetch_add(1, std::memory_order_relaxed); }
  void postEnded(std::string outcome);

 protected:
  // Stores copies and draws the sampling factor. The kinds' initWithName(…) come here.
  VeltraBackend(std::string name, std::string productFamily, platform::Random& random);
  void setDisplayURL(std::optional<std::string> value) { _displayURL = std::move(value); }

 private:
  // Constant after construction.
  const std::string _name;
  const std::string _productFamily;
  const double _samplingFactor;
  std::optional<std::string> _displayURL;

  // The session's thread only.
  std::uint16_t _eventID = 0;

  // Each indivisible on its own.
  std::atomic<StateVerdict> _state{StateVerdict()};
  std::atomic<std::uint32_t> _postsUnderWay{0};
  std::atomic<std::int32_t> _hierarchy{0};

  mutable Mutex _mutex BACKEND_LOCK;
  std::shared_ptr<const SessionFacts> _facts GUARDED_BY(_mutex) = std::make_shared<const SessionFacts>();
  std::optional<double> _samplingThreshold GUARDED_BY(_mutex);
  std::string _lastOutcome GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
