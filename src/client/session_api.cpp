// SPDX-License-Identifier: Apache-2.0
// The C interface's functions on sessions.
#include <cstdlib>
#include <cstring>

#include "client/calls.h"
#include "client/daemon_connection.h"
#include "client/daemon_socket.h"
#include "client/session_options.h"
#include "wire/names.h"
#include "wire/socket_path.h"

namespace client = veltrad::client;
namespace key = veltrad::wire::key;
namespace operation = veltrad::wire::operation;

using client::Answer;
using veltrad::Dictionary;

struct veltra_session {
  std::shared_ptr<client::DaemonConnection> connection;
  // It was made with a callback for copies.
  bool mayAggregate;
};

namespace {

constexpr std::size_t kDefaultQueueBytes = 1u << 20;

veltra_session* failed(veltra_status why, const std::string& text, veltra_status* status, char** error) {
  if (status) *status = why;
  if (error) *error = ::strdup(text.c_str());
  return nullptr;
}

std::function<void(const Dictionary&)> aggregationHandler(veltra_aggregation_callback callback,
                                                          void* context) {
  if (!callback) return nullptr;
  return [callback, context](const Dictionary& event) {
    const std::string* operation = event.string(key::kOperation);
    if (!operation || *operation != veltrad::wire::event::kSendMessageToClient) return;
    const Dictionary* given = event.dictionary(key::kArguments);
    const Dictionary arguments = given ? *given : Dictionary{};
    const Dictionary* sessionInfo = arguments.dictionary(key::kSessionInfo);
    const Dictionary* payload = arguments.dictionary(key::kPayload);
    const auto infoNode = sessionInfo ? client::nodeOfDictionary(*sessionInfo) : nullptr;
    const auto payloadNode = payload ? client::nodeOfDictionary(*payload) : nullptr;
    callback(context, infoNode.get(), arguments.real(key::kTimestamp).value_or(0),
             arguments.uint16(key::kCategory).value_or(0), arguments.uint16(key::kType).value_or(0),
             payloadNode.get());
  };
}

std::function<void(const client::StateChange&)> stateHandler(veltra_state_callback callback, void* context) {
  if (!callback) return nullptr;
  return [callback, context](const client::StateChange& change) {
    callback(context, change.state, change.backends.get(), change.why ? change.why->c_str() : nullptr);
  };
}

// Whether calls may be made.
veltra_status verdictOn(const veltra_session* session) {
  if (!session) return VELTRA_INVALID;
  return session->connection->forked() ? VELTRA_FORKED : VELTRA_OK;
}

veltra_status send(veltra_session* session, client::CallFrame made, veltra_callback callback, void* context) {
  if (const auto status = verdictOn(session); status != VELTRA_OK) return status;
  if (made.status != VELTRA_OK) return made.status;
  return session->connection->send(std::move(made.call), callback, context);
}

veltra_status sendAndWait(veltra_session* session, client::CallFrame made, veltra_reply** reply) {
  veltra_status status = verdictOn(session);
  if (status == VELTRA_OK) status = made.status;
  client::Answer answer;
  if (status == VELTRA_OK) {
    const auto connection = session->connection;  // keeps it alive during a close() that ends this call
    answer = connection->sendAndWait(std::move(made.call));
    client::settleUpload(*answer);
  } else {
    answer = client::answerOfStatus(status, made.problem.empty() ? nullptr : made.problem.c_str());
  }
  const veltra_status result = answer->status;
  if (reply) *reply = answer.release();
  return result;
}

client::CallFrame oneShot(const veltra_session_options* who, std::uint16_t category, std::uint16_t type,
                          const veltra_value* payload) {
  const auto options = client::completeOptions(who);
  if (!options) return {VELTRA_INVALID};
  return client::oneShotFrame(*options, category, type, payload);
}

}  // namespace

veltra_session* veltra_session_create(const veltra_session_options* given, veltra_status* status,
                                      char** error) {
  if (status) *status = VELTRA_OK;
  if (error) *error = nullptr;
  const auto options = client::completeOptions(given);
  if (!options) {
    return failed(VELTRA_INVALID,
                  "The session's options were not set up: call veltra_session_options_init first.", status,
                  error);
  }
  if (const auto problem = client::problemOfDescription(*options)) {
    return failed(VELTRA_INVALID, *problem, status, error);
  }
  const client::CallFrame description = client::sessionInfoFrame(*options);
  if (description.status != VELTRA_OK) {
    return failed(description.status,
                  "The user info is too large: with the session info it must fit into 1,048,576 bytes.",
                  status, error);
  }
  const std::string root =
      options->root && *options->root ? options->root : veltrad::wire::rootFromEnvironment();
  client::ConnectionOptions wanted{veltrad::wire::socketPathUnder(root),
                                   options->connect_timeout_ms
                                       ? std::chrono::milliseconds(options->connect_timeout_ms)
                                       : client::kGreetingTimeout,
                                   options->queue_bytes ? options->queue_bytes : kDefaultQueueBytes,
                                   aggregationHandler(options->aggregated, options->aggregated_context),
                                   stateHandler(options->state_changed, options->state_context)};
  std::optional<client::DaemonSocket> connected;
  if (options->connect_later) {
    if (const auto failure = client::verdictOnPath(wanted.path))
      return failed(failure->status, failure->text, status, error);
  } else {
    auto reached =
        client::reachDaemon(wanted.path, options->undescribed ? "" : description.call.bytes, wanted.patience);
    if (!reached) return failed(reached.error().status, reached.error().text, status, error);
    connected = std::move(reached).value();
  }
  std::string text;
  auto connection = client::DaemonConnection::make(
      std::move(wanted), options->undescribed ? std::nullopt : std::optional(*description.call.change),
      std::move(connected), text);
  if (!connection) return failed(VELTRA_NO_DAEMON, text, status, error);
  return new veltra_session{std::move(connection), options->aggregated != nullptr};
}

veltra_status veltra_session_describe(veltra_session* session, const veltra_session_options* given) {
  const auto options = client::completeOptions(given);
  if (!session || !options || client::problemOfDescription(*options)) return VELTRA_INVALID;
  if (options->aggregated && !session->mayAggregate) return VELTRA_INVALID;
  return send(session, client::sessionInfoFrame(*options), nullptr, nullptr);
}

void veltra_free(char* text) {
  std::free(text);
}

veltra_status veltra_session_start(veltra_session* session, veltra_callback callback, void* context) {
  return send(session, client::startFrame(), callback, context);
}

veltra_status veltra_session_start_wait(veltra_session* session, veltra_reply** reply) {
  return sendAndWait(session, client::startFrame(), reply);
}

veltra_status veltra_session_send(veltra_session* session, uint16_t category, uint16_t type,
                                  const veltra_value* payload, uint32_t flag, veltra_callback callback,
                                  void* context) {
  return send(session, client::messageFrame(category, type, payload, flag), callback, context);
}

veltra_status veltra_session_send_wait(veltra_session* session, uint16_t category, uint16_t type,
                                       const veltra_value* payload, uint32_t flag, veltra_reply** reply) {
  return sendAndWait(session, client::messageFrame(category, type, payload, flag), reply);
}

veltra_status veltra_session_send_dictionary(veltra_session* session, const veltra_value* message,
                                             veltra_callback callback, void* context) {
  return send(session, client::messageDictionaryFrame(message), callback, context);
}

veltra_status veltra_session_send_dictionary_wait(veltra_session* session, const veltra_value* message,
                                                  veltra_reply** reply) {
  return sendAndWait(session, client::messageDictionaryFrame(message), reply);
}

veltra_status veltra_session_send_one_shot(veltra_session* session, const veltra_session_options* who,
                                           uint16_t category, uint16_t type, const veltra_value* payload,
                                           veltra_callback callback, void* context) {
  return send(session, oneShot(who, category, type, payload), callback, context);
}

veltra_status veltra_session_send_one_shot_wait(veltra_session* session, const veltra_session_options* who,
                                                uint16_t category, uint16_t type, const veltra_value* payload,
                                                veltra_reply** reply) {
  return sendAndWait(session, oneShot(who, category, type, payload), reply);
}

veltra_status veltra_session_flush(veltra_session* session, veltra_callback callback, void* context) {
  return send(session, client::callFrame(operation::kFlushMessages), callback, context);
}

veltra_status veltra_session_flush_wait(veltra_session* session, veltra_reply** reply) {
  return sendAndWait(session, client::callFrame(operation::kFlushMessages), reply);
}

veltra_status veltra_session_upload_file(veltra_session* session, const char* path, veltra_callback callback,
                                         void* context) {
  return send(session, client::uploadFileFrame(path), callback, context);
}

veltra_status veltra_session_upload_file_wait(veltra_session* session, const char* path,
                                              veltra_reply** reply) {
  return sendAndWait(session, client::uploadFileFrame(path), reply);
}

veltra_status veltra_session_upload_log_data(veltra_session* session, const veltra_value* data,
                                             veltra_callback callback, void* context) {
  return send(session, client::logDataFrame(data), callback, context);
}

veltra_status veltra_session_upload_log_data_wait(veltra_session* session, const veltra_value* data,
                                                  veltra_reply** reply) {
  return sendAndWait(session, client::logDataFrame(data), reply);
}

veltra_status veltra_session_states(veltra_session* session, const veltra_value* user_info,
                                    veltra_callback callback, void* context) {
  return send(session, client::statesFrame(user_info), callback, context);
}

veltra_status veltra_session_states_wait(veltra_session* session, const veltra_value* user_info,
                                         veltra_reply** reply) {
  return sendAndWait(session, client::statesFrame(user_info), reply);
}

veltra_status veltra_session_display_url(veltra_session* session, veltra_callback callback, void* context) {
  return send(session, client::callFrame(operation::kFetchDisplayURL), callback, context);
}

veltra_status veltra_session_display_url_wait(veltra_session* session, veltra_reply** reply) {
  return sendAndWait(session, client::callFrame(operation::kFetchDisplayURL), reply);
}

veltra_status veltra_session_finish(veltra_session* session, veltra_callback callback, void* context) {
  return send(session, client::finishFrame(), callback, context);
}

veltra_status veltra_session_finish_wait(veltra_session* session, veltra_reply** reply) {
  return sendAndWait(session, client::finishFrame(), reply);
}

void veltra_session_statistics(veltra_session* session, veltra_statistics* statistics) {
  if (!statistics) return;
  *statistics = verdictOn(session) == VELTRA_OK ? session->connection->statistics() : veltra_statistics{};
}

uint64_t veltra_session_counter(veltra_session* session, veltra_counter which) {
  return verdictOn(session) == VELTRA_OK ? session->connection->counter(which) : 0;
}

uint64_t veltra_session_close(veltra_session* session) {
  if (!session || session->connection->onOwnThread()) return 0;
  const bool forked = session->connection->forked();
  if (forked) client::DaemonConnection::abandon(std::move(session->connection));
  const uint64_t lost = forked ? 0 : session->connection->close();
  delete session;
  return lost;
}
