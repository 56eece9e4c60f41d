// SPDX-License-Identifier: Apache-2.0
// libveltra for C++20: a header-only interface to veltra.h with owners for its handles. Nothing throws; the
// rules of veltra.h on threads, callbacks and processes apply.
//
//   veltra::Session session{{.clientType = 7, .sessionID = 42, .clientName = "phone"}};
//   if (!session) std::cerr << session.error().description << '\n';
//   session.start();
//   session.send(5, 1, {{"codec", "opus"}, {"seconds", 12.5}}).get();
#ifndef VELTRA_VELTRA_HPP
#define VELTRA_VELTRA_HPP

#include <chrono>
#include <cstdint>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "veltra/value.hpp"
#include "veltra/veltra.h"

namespace veltra {

// ---- Answers ----

using Status = veltra_status;
using ClientType = veltra_client_type;
using Flag = veltra_flag;
using MessageKind = veltra_message_kind;
using Statistics = veltra_statistics;

struct Error {
  Status status = VELTRA_OK;
  std::string domain;
  std::int64_t code = 0;
  std::string description;
};

// A value or an error.
template <typename T>
class Result {
 public:
  Result(T value) : _side(std::in_place_index<0>, std::move(value)) {}
  Result(Error error) : _side(std::in_place_index<1>, std::move(error)) {}
  explicit operator bool() const { return _side.index() == 0; }
  // Only if there is a value.
  const T& operator*() const { return *std::get_if<0>(&_side); }
  const T* operator->() const { return std::get_if<0>(&_side); }
  // Empty if there is a value.
  Error error() const { return *this ? Error{} : *std::get_if<1>(&_side); }

 private:
  std::variant<T, Error> _side;
};

// The back ends that report; absent if there are none.
using Backends = std::optional<std::vector<std::string>>;
inline Backends backendsOf(const veltra_value* names) {
  if (!names) return std::nullopt;
  Backends made{std::in_place};
  for (std::size_t i = 0; i < veltra_count(names); ++i) {
    std::size_t length = 0;
    const char* name = veltra_get_string(veltra_array_item(names, i), &length);
    if (name) made->emplace_back(name, length);
  }
  return made;
}

// What has become of a message in one back end: the texts of veltra_reply_outcomes().
struct Outcome {
  std::string backend;
  std::string outcome;
  std::string reason;
  std::string text;
};

// The answer to a call.
struct Reply {
  Status status = VELTRA_OK;
  std::optional<std::string> text;
  Backends backends;
  // Absent if the call sent no message or the daemon is older.
  std::optional<std::vector<Outcome>> outcomes;
  bool uploaded = false;
  // An uploaded file was confirmed and removed.
  bool removed = false;
  // In the answer or, if the status is not VELTRA_OK, of the call.
  std::optional<Error> error;

  explicit operator bool() const { return status == VELTRA_OK; }

  static Reply of(const veltra_reply* reply) {
    Reply made;
    made.status = veltra_reply_status(reply);
    std::size_t length = 0;
    if (const char* text = veltra_reply_text(reply, &length)) made.text.emplace(text, length);
    made.backends = backendsOf(veltra_reply_backends(reply));
    if (const veltra_value* outcomes = veltra_reply_outcomes(reply)) {
      made.outcomes.emplace();
      for (std::size_t at = 0; at < veltra_count(outcomes); ++at) {
        made.outcomes->push_back(outcomeOf(veltra_array_item(outcomes, at)));
      }
    }
    made.uploaded = veltra_reply_uploaded(reply);
    made.removed = veltra_reply_removed(reply);
    if (const char* description = veltra_reply_error_description(reply)) {
      made.error =
          Error{made.status, veltra_reply_error_domain(reply), veltra_reply_error_code(reply), description};
    }
    return made;
  }
  static Reply of(Status status) {
    Reply made;
    made.status = status;
    made.error = Error{status, "", -1, veltra_status_text(status)};
    return made;
  }

 private:
  static Outcome outcomeOf(const veltra_value* given) {
    const auto text = [given](const char* key) {
      std::size_t length = 0;
      const char* found = veltra_get_string(veltra_dictionary_item(given, key), &length);
      return found ? std::string(found, length) : std::string();
    };
    return {text("backend"), text("outcome"), text("reason"), text("text")};
  }
};

using Callback = std::function<void(const Reply&)>;
// See veltra_state_callback; `why` is empty if there is nothing to say.
using StateHandler =
    std::function<void(veltra_connection_state state, const Backends& backends, const std::string& why)>;

// ---- Sessions ----

// A copy of a message of this session or of one below it. If everything is empty or zero, aggregation has
// ended.
struct Aggregated {
  Value sessionInfo;
  // In seconds since 1970.
  double timestamp = 0;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  Value payload;
};

// Absent values are left out of the description of the session.
// Its 16 fields are those of veltra_session_options.
struct Options {
  // 0 to 17: a ClientType.
  std::optional<std::int32_t> clientType = {};
  std::optional<std::uint32_t> sessionID = {};
  std::optional<std::uint16_t> clientVersion = {};
  std::optional<std::string> clientName = {};
  std::optional<std::string> serviceName = {};
  // A dictionary, to which the two names are added.
  Value userInfo = {};
  bool requireUserInfo = false;
  bool batchEvents = false;
  // If not empty, this session aggregates.
  std::function<void(const Aggregated&)> aggregated = {};
  // If absent: VELTRA_ROOT, else "/".
  std::optional<std::string> root = {};
  // 0 means 1 MiB.
  std::size_t queueBytes = 0;
  // Does not describe the session on connecting: for one-shot messages.
  bool undescribed = false;
  // Neither waits for a daemon nor fails for want of one.
  bool connectLater = false;
  // 0 means 5 s.
  std::chrono::milliseconds connectTimeout{0};
  // If not empty, learns of each change of the connection's state.
  StateHandler stateChanged = {};
  // An array of names, or nothing.
  Value frameworksToCheck = {};
};

// A session. If it could not be made, it is false, error() says why, and it refuses every call.
class Session {
 public:
  explicit Session(const Options& options = {})
      : _aggregated(sharedHandler(options.aggregated)), _stateChanged(sharedHandler(options.stateChanged)) {
    veltra_session_options plain = identityOf(options);
    plain.root = text(options.root);
    plain.undescribed = options.undescribed;
    plain.aggregated = _aggregated ? &onAggregated : nullptr;
    plain.aggregated_context = _aggregated.get();
    plain.queue_bytes = options.queueBytes;
    plain.connect_later = options.connectLater;
    plain.connect_timeout_ms = static_cast<std::uint32_t>(options.connectTimeout.count());
    plain.state_changed = _stateChanged ? &onState : nullptr;
    plain.state_context = _stateChanged.get();
    char* why = nullptr;
    _session = veltra_session_create(&plain, &_error.status, &why);
    if (why) _error.description = why;
    veltra_free(why);
  }
  Session(Session&& other) noexcept
      : _aggregated(std::move(other._aggregated)),
        _stateChanged(std::move(other._stateChanged)),
        _session(std::exchange(other._session, nullptr)),
        _error(std::move(other._error)) {}
  Session& operator=(Session other) noexcept {
    std::swap(_aggregated, other._aggregated);
    std::swap(_stateChanged, other._stateChanged);
    std::swap(_session, other._session);
    std::swap(_error, other._error);
    return *this;
  }
  ~Session() { close(); }

  explicit operator bool() const { return _session != nullptr; }
  const Error& error() const { return _error; }

  // These functions wait for the daemon.
  Result<Backends> start() { return backends(wait(&veltra_session_start_wait)); }
  Result<Backends> states(const Value& userInfo = {}) {
    return backends(wait(&veltra_session_states_wait, userInfo.get()));
  }
  Result<std::optional<std::string>> displayURL() {
    Reply reply = wait(&veltra_session_display_url_wait);
    if (!reply) return *std::move(reply.error);
    return std::move(reply.text);
  }
  Reply flush() { return wait(&veltra_session_flush_wait); }
  Reply finish() { return wait(&veltra_session_finish_wait); }
  Reply sendAndWait(std::uint16_t category, std::uint16_t type, const Dictionary& payload,
                    std::uint32_t flag = 0) {
    return wait(&veltra_session_send_wait, category, type, payload.get(), flag);
  }

  // Describes the live session anew, with the session info, user info and frameworks of `who`. It ends its
  // aggregation if `who` has no handler; the handler itself stays. Does not wait.
  Status describe(const Options& who) {
    veltra_session_options plain = identityOf(who);
    plain.aggregated = who.aggregated ? &onAggregated : nullptr;
    return veltra_session_describe(_session, &plain);
  }

  // These do not wait. flag: 0 to 3, see Flag.
  std::future<Reply> send(std::uint16_t category, std::uint16_t type, const Dictionary& payload = {},
                          std::uint32_t flag = 0) {
    return promised(
        [&](Callback callback) { return send(category, type, payload, std::move(callback), flag); });
  }
  Status send(std::uint16_t category, std::uint16_t type, const Dictionary& payload, Callback callback,
              std::uint32_t flag = 0) {
    return call(std::move(callback), &veltra_session_send, category, type, payload.get(), flag);
  }
  // The fastest way: asks for no answer.
  Status post(std::uint16_t category, std::uint16_t type, const Dictionary& payload = {},
              std::uint32_t flag = 0) {
    return veltra_session_send(_session, category, type, payload.get(), flag, nullptr, nullptr);
  }
  // Sends "category", "type", "payload" and "flag" unchanged; the daemon checks them.
  std::future<Reply> send(const Dictionary& message) {
    return promised([&](Callback callback) {
      return call(std::move(callback), &veltra_session_send_dictionary, message.get());
    });
  }
  // The session need not be started. Of `who`, the fields before `aggregated` are used. The text of the reply
  // is "finished" or "storebag not available".
  std::future<Reply> sendOneShot(const Options& who, std::uint16_t category, std::uint16_t type,
                                 const Dictionary& payload = {}) {
    return promised([&](Callback callback) {
      const veltra_session_options plain = identityOf(who);
      return call(std::move(callback), &veltra_session_send_one_shot, &plain, category, type, payload.get());
    });
  }
  // The answer arrives after those of the servers. A file that the server has confirmed is `removed`, unless
  // `error` says why not. One that is not `uploaded` stays; `error` may say why.
  std::future<Reply> uploadFile(const std::string& path) {
    return promised([&](Callback callback) {
      return call(std::move(callback), &veltra_session_upload_file, path.c_str());
    });
  }
  // `data` is an array. The answer arrives after those of the servers; `uploaded` says whether any accepted
  // it.
  std::future<Reply> uploadLogData(const Value& data) {
    return promised([&](Callback callback) {
      return call(std::move(callback), &veltra_session_upload_log_data, data.get());
    });
  }
  Status start(Callback callback) { return call(std::move(callback), &veltra_session_start); }
  Status flush(Callback callback) { return call(std::move(callback), &veltra_session_flush); }
  Status states(const Value& userInfo, Callback callback) {
    return call(std::move(callback), &veltra_session_states, userInfo.get());
  }
  Status displayURL(Callback callback) { return call(std::move(callback), &veltra_session_display_url); }
  Status finish(Callback callback) { return call(std::move(callback), &veltra_session_finish); }

  Statistics statistics() const {
    Statistics counts{};
    veltra_session_statistics(_session, &counts);
    return counts;
  }
  std::uint64_t counter(veltra_counter which) const { return veltra_session_counter(_session, which); }
  // Returns the number of lost messages that counter() has not told. The destructor calls it. Not to be
  // called in a callback.
  std::uint64_t close() { return veltra_session_close(std::exchange(_session, nullptr)); }

 private:
  using Handler = std::function<void(const Aggregated&)>;

  static const char* text(const std::optional<std::string>& given) {
    return given ? given->c_str() : nullptr;
  }
  // Refers to the texts of `options`.
  static veltra_session_options identityOf(const Options& options) {
    veltra_session_options plain;
    veltra_session_options_init(&plain);
    plain.has_client_type = options.clientType.has_value();
    plain.client_type = options.clientType.value_or(0);
    plain.has_session_id = options.sessionID.has_value();
    plain.session_id = options.sessionID.value_or(0);
    plain.has_client_version = options.clientVersion.has_value();
    plain.client_version = options.clientVersion.value_or(0);
    plain.require_user_info = options.requireUserInfo;
    plain.batch_events = options.batchEvents;
    plain.user_info = options.userInfo.get();
    plain.client_name = text(options.clientName);
    plain.service_name = text(options.serviceName);
    plain.frameworks_to_check = options.frameworksToCheck.get();
    return plain;
  }
  template <typename Function>
  static std::unique_ptr<Function> sharedHandler(const Function& handler) {
    return handler ? std::make_unique<Function>(handler) : nullptr;
  }
  static void onState(void* context, veltra_connection_state state, const veltra_value* backends,
                      const char* why) {
    (*static_cast<StateHandler*>(context))(state, backendsOf(backends), why ? why : "");
  }
  static void onAggregated(void* context, const veltra_value* sessionInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type, const veltra_value* payload) {
    (*static_cast<Handler*>(context))(
        Aggregated{Value::share(sessionInfo), timestamp, category, type, Value::share(payload)});
  }
  static void onReply(void* context, const veltra_reply* reply) {
    const std::unique_ptr<Callback> callback(static_cast<Callback*>(context));
    (*callback)(Reply::of(reply));
  }

  template <typename Function, typename... Arguments>
  Reply wait(Function function, Arguments... arguments) {
    veltra_reply* answered = nullptr;
    function(_session, arguments..., &answered);
    Reply reply = Reply::of(answered);
    veltra_reply_release(answered);
    return reply;
  }
  // An empty callback asks for no answer.
  template <typename Function, typename... Arguments>
  Status call(Callback callback, Function function, Arguments... arguments) {
    if (!callback) return function(_session, arguments..., nullptr, nullptr);
    auto kept = std::make_unique<Callback>(std::move(callback));
    const Status status = function(_session, arguments..., &onReply, kept.get());
    if (status == VELTRA_OK) (void)kept.release();  // owned by onReply
    return status;
  }
  template <typename Call>
  static std::future<Reply> promised(Call start) {
    auto promise = std::make_shared<std::promise<Reply>>();
    std::future<Reply> future = promise->get_future();
    const Status status = start([promise](const Reply& reply) { promise->set_value(reply); });
    if (status != VELTRA_OK) promise->set_value(Reply::of(status));
    return future;
  }
  static Result<Backends> backends(Reply reply) {
    if (!reply) return *std::move(reply.error);
    return std::move(reply.backends);
  }

  std::unique_ptr<Handler> _aggregated;
  std::unique_ptr<StateHandler> _stateChanged;
  veltra_session* _session = nullptr;
  Error _error;
};

}  // namespace veltra

#endif
