// SPDX-License-Identifier: Apache-2.0
// Makes calls through the C interface and waits for their answers.
#include "tools/ctl/client_session.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "client/value_node.h"

namespace veltrad::ctl {
namespace {

constexpr std::chrono::milliseconds kProgressInterval{500};
// A daemon that is restarted comes back within this time.
constexpr std::chrono::seconds kLongestLoss{5};

// Null for no dictionary.
client::ValuePointer nodeOf(const std::optional<Dictionary>& dictionary) {
  return dictionary ? client::nodeOfDictionary(*dictionary) : nullptr;
}

// Nothing if it is not a dictionary.
std::optional<Dictionary> dictionaryOf(const veltra_value* value) {
  if (veltra_type_of(value) != VELTRA_TYPE_DICTIONARY) return std::nullopt;
  return client::dictionaryOfNode(value);
}

Answer answerOf(const veltra_reply* reply) {
  Answer answer;
  answer.status = veltra_reply_status(reply);
  std::size_t length = 0;
  if (const char* text = veltra_reply_text(reply, &length)) answer.reply.emplace(text, length);
  if (const veltra_value* backends = veltra_reply_backends(reply)) {
    answer.backends = client::valueOfNode(*backends).takeArray();
  }
  if (const veltra_value* outcomes = veltra_reply_outcomes(reply)) {
    answer.outcomes = client::valueOfNode(*outcomes).takeArray();
  }
  answer.uploaded = veltra_reply_uploaded(reply);
  answer.removed = veltra_reply_removed(reply);
  const char* domain = veltra_reply_error_domain(reply);
  const char* description = veltra_reply_error_description(reply);
  if (domain && description)
    answer.error = wire::ReportingError{domain, veltra_reply_error_code(reply), description};
  if (answer.status != VELTRA_OK && !answer.error) answer.error = answerOfFailure(answer.status).error;
  return answer;
}

// Borrows `userInfo`.
veltra_session_options optionsOf(const Identity& identity, const client::ValuePointer& userInfo) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.has_client_type = identity.clientType.has_value();
  options.client_type = identity.clientType.value_or(0);
  options.has_session_id = identity.sessionID.has_value();
  options.session_id = identity.sessionID.value_or(0);
  options.has_client_version = identity.clientVersion.has_value();
  options.client_version = identity.clientVersion.value_or(0);
  options.require_user_info = identity.requireUserInfo;
  options.batch_events = identity.batchEvents;
  options.user_info = userInfo.get();
  return options;
}

}  // namespace

ClientSession::ClientSession(Interrupt& interrupt, CopyHandler aggregated)
    : _interrupt(interrupt),
      _aggregated(std::move(aggregated)),
      _arrived(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

ClientSession::~ClientSession() {
  close();
}

std::optional<std::string> ClientSession::open(const std::optional<std::string>& root,
                                               const std::optional<Identity>& identity) {
  if (_arrived.get() < 0) return std::string("cannot make an event descriptor: ") + std::strerror(errno);
  const Identity described = identity.value_or(Identity());
  const auto userInfo = nodeOf(described.userInfo);
  veltra_session_options options = optionsOf(described, userInfo);
  options.undescribed = !identity;
  options.aggregated = _aggregated ? &ClientSession::aggregated : nullptr;
  options.aggregated_context = this;
  options.root = root ? root->c_str() : nullptr;
  options.state_changed = &ClientSession::stateChanged;
  options.state_context = this;
  veltra_status status = VELTRA_OK;
  char* error = nullptr;
  _session = veltra_session_create(&options, &status, &error);
  if (_session) {
    _interrupt.begin();
    return std::nullopt;
  }
  std::string text = error ? error : veltra_status_text(status);
  veltra_free(error);
  return text;
}

std::optional<Answer> ClientSession::start() {
  return await(veltra_session_start);
}

std::optional<Answer> ClientSession::send(const Dictionary& message) {
  const auto value = client::nodeOfDictionary(message);
  return await([&value](veltra_session* session, veltra_callback callback, void* context) {
    return veltra_session_send_dictionary(session, value.get(), callback, context);
  });
}

std::optional<Answer> ClientSession::send(std::uint16_t category, std::uint16_t type,
                                          const std::optional<Dictionary>& payload, std::uint32_t flag) {
  const auto value = nodeOf(payload);
  return await([&](veltra_session* session, veltra_callback callback, void* context) {
    return veltra_session_send(session, category, type, value.get(), flag, callback, context);
  });
}

std::optional<Answer> ClientSession::sendOneShot(const Identity& who, std::uint16_t category,
                                                 std::uint16_t type,
                                                 const std::optional<Dictionary>& payload) {
  const auto userInfo = nodeOf(who.userInfo);
  const veltra_session_options options = optionsOf(who, userInfo);
  const auto value = nodeOf(payload);
  return await([&](veltra_session* session, veltra_callback callback, void* context) {
    return veltra_session_send_one_shot(session, &options, category, type, value.get(), callback, context);
  });
}

std::optional<Answer> ClientSession::flush() {
  return await(veltra_session_flush);
}

std::optional<Answer> ClientSession::states(const std::optional<Dictionary>& userInfo) {
  const auto value = nodeOf(userInfo);
  return await([&value](veltra_session* session, veltra_callback callback, void* context) {
    return veltra_session_states(session, value.get(), callback, context);
  });
}

std::optional<Answer> ClientSession::displayURL() {
  return await(veltra_session_display_url);
}

std::optional<Answer> ClientSession::uploadFile(const std::string& path, const Progress& progress) {
  return await(
      [&path](veltra_session* session, veltra_callback callback, void* context) {
        return veltra_session_upload_file(session, path.c_str(), callback, context);
      },
      progress);
}

std::optional<Answer> ClientSession::uploadLogData(const Array& data) {
  const auto value = client::nodeOfValue(data);
  return await([&value](veltra_session* session, veltra_callback callback, void* context) {
    return veltra_session_upload_log_data(session, value.get(), callback, context);
  });
}

std::optional<Answer> ClientSession::finish() {
  return await(veltra_session_finish);
}

std::uint64_t ClientSession::close() {
  veltra_session* session = std::exchange(_session, nullptr);
  return session ? veltra_session_close(session) : 0;
}

std::optional<Answer> ClientSession::await(const Call& call, const Progress& progress) {
  const veltra_status status = call(_session, &ClientSession::answered, this);
  if (status != VELTRA_OK) return answerOfFailure(status);
  const auto begin = std::chrono::steady_clock::now();
  auto wake = Interrupt::Wake::timeout;
  while ((wake = _interrupt.wait(_arrived.get(), kProgressInterval)) == Interrupt::Wake::timeout) {
    if (lostForLong()) return answerOfFailure(VELTRA_NO_DAEMON);
    if (progress)
      progress(std::chrono::duration_cast<std::chrono::seconds>(std::chrono::steady_clock::now() - begin));
  }
  if (progress) progress(std::nullopt);
  if (wake == Interrupt::Wake::interrupted) return std::nullopt;
  eventfd_t arrived = 0;
  eventfd_read(_arrived.get(), &arrived);
  Lock lock(_mutex);
  return std::exchange(_answer, std::nullopt);
}

bool ClientSession::lostForLong() {
  Lock lock(_mutex);
  return _lost && std::chrono::steady_clock::now() - *_lost > kLongestLoss;
}

void ClientSession::stateChanged(void* context, veltra_connection_state state, const veltra_value*,
                                 const char*) {
  auto& self = *static_cast<ClientSession*>(context);
  Lock lock(self._mutex);
  if (state == VELTRA_STATE_LOST) self._lost = std::chrono::steady_clock::now();
  if (state == VELTRA_STATE_CONNECTED) self._lost.reset();
}

void ClientSession::answered(void* context, const veltra_reply* reply) {
  auto& self = *static_cast<ClientSession*>(context);
  Answer answer = answerOf(reply);
  {
    Lock lock(self._mutex);
    self._answer = std::move(answer);
  }
  eventfd_write(self._arrived.get(), 1);
}

void ClientSession::aggregated(void* context, const veltra_value* sessionInfo, double timestamp,
                               std::uint16_t category, std::uint16_t type, const veltra_value* payload) {
  const auto& self = *static_cast<const ClientSession*>(context);
  self._aggregated({dictionaryOf(sessionInfo), timestamp, category, type, dictionaryOf(payload)});
}

}  // namespace veltrad::ctl
