// SPDX-License-Identifier: Apache-2.0
// VeltraBackend, the base of all back ends. The session's thread configures it, sends and flushes; other
// sessions' threads and the HTTP thread use its facts, state and sampling threshold.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/backend_state_recorder.h"
#include "backends/client_match.h"
#include "backends/lock_ranks.h"
#include "backends/session_facts.h"
#include "base/mutex.h"
#include "base/value.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/fate_writer.h"
#include "platform/random.h"
#include "wire/error.h"
#include "wire/fates.h"
#include "wire/reasons.h"

namespace veltrad::backends {

// The state of a back end. A client is told that 2 and 3 report.
enum BackendState : std::int32_t {
  // Before the first updateState, or required user info is missing.
  kBackendWaiting = 0,
  kBackendDisabled = 1,
  kBackendReporting = 2,
  // Sampled out, but held instead of disabled.
  kBackendHeld = 3,
};

// A state and its reason. Aligned so that both change in one atomic store.
struct alignas(8) StateVerdict {
  std::int32_t state = kBackendWaiting;
  wire::Reason reason = wire::Reason::waits_for_user_info;
};

// The messages that a back end currently handles.
struct BackendActivity {
  std::size_t held = 0;      // events that wait for a flush, datagrams that wait for the socket
  std::size_t underWay = 0;  // posts without an answer, datagrams without an acknowledgement
  std::string lastOutcome;   // of the last post: "HTTP 200", a transport's text; empty: none
};

// A back end's decision on a message, and the readable text of what it has sent, if any.
struct Sent {
  wire::Decision decision;
  std::optional<std::string> text;
};

// The data of a message before it reaches a back end.
struct MessageNote {
  // The fields of the payload that the owner withholds; null if none. Valid during the call.
  const config::EditedFields* edits = nullptr;
  // The number in the record of fates; 0 if it is not recorded.
  std::uint64_t number = 0;
  // The entry of its session in the record.
  wire::FateRef session = 0;
};

struct NumberedMessage {
  // Without the fields that the owner of the device withholds.
  std::optional<Dictionary> payload;
  platform::TimeValue timestamp;
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::uint16_t eventID = 0;
  std::int32_t flag = 0;
  MessageNote note = {};
};

// One back end of one session. It outlives its session only until its own work is done. Its 15 fields are
// common to all kinds: its name, state, facts of the session, and record of fates.
class VeltraBackend : public std::enable_shared_from_this<VeltraBackend> {
 public:
  // Gets an optional result text and an optional error. Called exactly once, possibly on another thread.
  using FlushCompletion =
      std::function<void(std::optional<std::string>, std::optional<wire::ReportingError>)>;

  virtual ~VeltraBackend() = default;

  // Lower-case hexadecimal SHA-256 of the text's UTF-8 bytes, 64 characters.
  static std::string convertIntoSHA256(std::string_view text);

  // Continues the session's previous back end of the same name: takes its event number and its batch. Called
  // before the first message and before other threads know this back end; the previous one sends nothing from
  // then on.
  virtual void takeOver(VeltraBackend& before) { _eventID = before._eventID; }
  // Called before the session releases the back end.
  virtual void cleanup() {}
  virtual void updateState();

  // Numbers the message (1, 2, … 65535, 0, …) and passes it on.
  Sent sendMessage(std::optional<Dictionary> payload, platform::TimeValue timestamp, std::uint16_t method,
                   std::uint16_t respCode, std::int32_t flag, const MessageNote& note = {});
  // May take the payload out of the message, so that nothing in it needs to be copied. By default the back
  // end takes no messages.
  virtual Sent sendNumberedMessage(NumberedMessage&& message);
  // By default completes at once without a text or an error. `completion` may be empty.
  virtual std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion);
  virtual bool uploadFileAtPath(const std::string& path, const std::string& extensionToken,
                                const MessageNote& note);
  virtual bool uploadLogData(const Array& logData, const MessageNote& note);
  virtual void setCorrelatedSessionID(const std::string& sessionID);
  // Takes the device's new identifier, and replaces the back end's own identifiers.
  virtual void takeIdentity(const std::string& udid);
  // Reads the consent again, because the policy requires consent for open sessions, too.
  virtual void rereadConsent() {}
  // Drops waiting data that contains the device's identifier. Any thread.
  virtual void dropIdentified() {}

  // Constant after construction.
  const std::string& name() const { return _name; }
  const std::string& productFamily() const { return _productFamily; }
  // In [0, 1), drawn once.
  double samplingFactor() const { return _samplingFactor; }
  const std::optional<std::string>& displayURL() const { return _displayURL; }
  // Sets the ring for the record of fates, before the first message; may be null.
  void keepFates(platform::FateRing* ring) { _pen = {ring, _name}; }
  const platform::FateWriter& pen() const { return _pen; }

  // Any thread. Never null; a change of the facts does not affect those that a caller already has.
  SharedFacts facts() const;
  void setFacts(SharedFacts facts);
  void setUserInfoDict(const UserInfo& info);
  std::int32_t state() const { return stateVerdict().state; }
  // Disabled while the owner of the device forbids it.
  StateVerdict stateVerdict() const {
    const auto forbidden = prohibition();
    return forbidden ? StateVerdict{kBackendDisabled, *forbidden} : ownVerdict();
  }
  // The state without the owner's decision.
  StateVerdict ownVerdict() const { return _state.load(std::memory_order_relaxed); }
  void setState(StateVerdict verdict) { _state.store(verdict, std::memory_order_relaxed); }
  std::int32_t hierarchy() const { return _hierarchy.load(std::memory_order_relaxed); }
  void setHierarchy(std::int32_t value) { _hierarchy.store(value, std::memory_order_relaxed); }
  std::optional<double> samplingThreshold() const;
  void setSamplingThreshold(std::optional<double> value);
  virtual BackendActivity activity() const;
  // Why the owner of the device forbids it to report; absent if it may.
  std::optional<wire::Reason> prohibition() const {
    const int reason = _prohibition.load(std::memory_order_relaxed);
    return reason < 0 ? std::nullopt : std::optional(static_cast<wire::Reason>(reason));
  }
  // Also drops what waits, if there is a reason.
  void setProhibition(std::optional<wire::Reason> reason);
  // The hosts that it may send to; empty if it sends nowhere. The session's thread.
  virtual std::vector<std::string> hosts() const { return {}; }
  // False if updateState() may change the hosts, so that no other thread may ask for them.
  virtual bool hostsAreFixed() const { return true; }
  // A post begins; a post has ended with this result.
  void postBegins() { _postsUnderWay.fetch_add(1, std::memory_order_relaxed); }
  void postEnded(std::string outcome);

 protected:
  // Drops and counts the events and datagrams that wait. Any thread.
  virtual void dropWaiting() {}
  // Draws the sampling factor.
  VeltraBackend(std::string name, std::string productFamily, platform::Random& random);
  void setDisplayURL(std::optional<std::string> value) { _displayURL = std::move(value); }
  // The session's thread.
  virtual ClientMatch clientMatch() const { return {}; }
  // An entry of the record for a step of the message, with the state of the back end. The session's thread.
  wire::StepEntry stepOf(const NumberedMessage& message);
  // The same for a file or log data.
  wire::StepEntry stepOf(const MessageNote& note);
  // Records the final decision on the message in this back end.
  Sent settled(const NumberedMessage& message, wire::Decision decision);

 private:
  wire::StandingEntry standing() const;

  // Constant after construction.
  const std::string _name;
  const std::string _productFamily;
  const double _samplingFactor;
  std::optional<std::string> _displayURL;
  platform::FateWriter _pen;

  // The session's thread only.
  std::uint16_t _eventID = 0;
  BackendStateRecorder _standing;

  std::atomic<StateVerdict> _state{StateVerdict()};
  std::atomic<int> _prohibition{-1};  // a reason; negative: none
  std::atomic<std::uint32_t> _postsUnderWay{0};
  std::atomic<std::int32_t> _hierarchy{0};

  mutable Mutex _mutex BACKEND_LOCK;
  SharedFacts _facts GUARDED_BY(_mutex) = std::make_shared<const SessionFacts>();
  std::optional<double> _samplingThreshold GUARDED_BY(_mutex);
  std::string _lastOutcome GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
