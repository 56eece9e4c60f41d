// SPDX-License-Identifier: Apache-2.0
// Sets libnats up and waits for its callbacks at the end.
#include "gateway/nats_connection.h"

#include <nats/nats.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <fstream>

#include "gateway/attempt.h"
#include "platform/log.h"

namespace veltrad::gateway {

namespace {

// A server that does not answer pings is left for another one.
constexpr std::int64_t kPingMilliseconds = 2'000;
constexpr int kMostPingsOut = 2;
constexpr std::int64_t kReconnectMilliseconds = 250;
constexpr std::int64_t kConnectMilliseconds = 2'000;
constexpr std::int64_t kWriteMilliseconds = 5'000;
// A lost connection keeps nothing, because unanswered messages are published again.
constexpr int kReconnectBytes = 64 << 10;
constexpr std::chrono::seconds kLongestClose{5};

struct FreeOptions {
  void operator()(natsOptions* options) const { natsOptions_Destroy(options); }
};
using OwnedOptions = std::unique_ptr<natsOptions, FreeOptions>;

// A user's name and password are read once; of the other form the library reads the file when it connects.
Result<natsStatus, std::string> applyCredentials(natsOptions* made, const std::string& path) {
  errno = 0;
  std::ifstream file(path);
  std::string line;
  if (!std::getline(file, line))
    return Failure{path + ": " + (errno == 0 ? "it is empty" : std::strerror(errno))};
  const std::size_t colon = line.find(':');
  if (colon == std::string::npos) return natsOptions_SetUserCredentialsFromFiles(made, path.c_str(), nullptr);
  return natsOptions_SetUserInfo(made, line.substr(0, colon).c_str(), line.substr(colon + 1).c_str());
}

natsStatus applyOptions(natsOptions* made, const StreamOptions& given) {
  std::vector<const char*> servers;
  for (const std::string& server : given.servers) servers.push_back(server.c_str());
  natsStatus status = natsOptions_SetServers(made, servers.data(), static_cast<int>(servers.size()));
  const auto then = [&status](natsStatus next) {
    if (status == NATS_OK) status = next;
  };
  then(natsOptions_SetName(made, "veltra-gateway"));
  then(natsOptions_SetMaxReconnect(made, -1));
  then(natsOptions_SetReconnectWait(made, kReconnectMilliseconds));
  then(natsOptions_SetReconnectBufSize(made, kReconnectBytes));
  then(natsOptions_SetTimeout(made, kConnectMilliseconds));
  then(natsOptions_SetWriteDeadline(made, kWriteMilliseconds));
  then(natsOptions_SetPingInterval(made, kPingMilliseconds));
  then(natsOptions_SetMaxPingsOut(made, kMostPingsOut));
  then(natsOptions_SetCustomInboxPrefix(made, given.inbox.c_str()));
  if (given.ca.empty()) return status;
  then(natsOptions_LoadCATrustedCertificates(made, given.ca.c_str()));
  then(natsOptions_SetSecure(made, true));
  return status;
}

}  // namespace

struct NATSCallbacks {
  static void connected(natsConnection*, void* closure) {
    const auto* self = static_cast<NATSConnection*>(closure);
    logInfo("stream: connected");
    if (self->_reconnected) self->_reconnected();
  }
  static void disconnected(natsConnection*, void*) { logWarning("stream: disconnected"); }
  static void closed(natsConnection*, void* closure) {
    static_cast<NATSConnection*>(closure)->_closed.set_value();
  }
  // Without it the library writes to standard error.
  static void failed(natsConnection*, natsSubscription*, natsStatus status, void* closure) {
    auto* self = static_cast<NATSConnection*>(closure);
    attempt([&] {
      if (const auto line = self->_faults.happened(std::string("stream: ") + natsStatus_GetText(status)))
        logWarning("%s", line->c_str());
    });
  }
};

Result<std::unique_ptr<NATSConnection>, std::string> NATSConnection::open(const StreamOptions& options,
                                                                          std::function<void()> reconnected) {
  std::unique_ptr<NATSConnection> self(new NATSConnection);
  self->_reconnected = std::move(reconnected);
  natsOptions* made = nullptr;
  natsStatus status = natsOptions_Create(&made);
  const OwnedOptions owned(made);
  if (status == NATS_OK) status = applyOptions(made, options);
  if (status == NATS_OK && !options.credentials.empty()) {
    const auto applied = applyCredentials(made, options.credentials);
    if (!applied) return Failure{"--credentials " + applied.error()};
    status = applied.value();
  }
  if (status == NATS_OK) status = natsOptions_SetReconnectedCB(made, &NATSCallbacks::connected, self.get());
  if (status == NATS_OK) status = natsOptions_SetDisconnectedCB(made, &NATSCallbacks::disconnected, nullptr);
  if (status == NATS_OK) status = natsOptions_SetClosedCB(made, &NATSCallbacks::closed, self.get());
  if (status == NATS_OK) status = natsOptions_SetErrorHandler(made, &NATSCallbacks::failed, self.get());
  if (status == NATS_OK)
    status = natsOptions_SetRetryOnFailedConnect(made, true, &NATSCallbacks::connected, self.get());
  if (status == NATS_OK) {
    status = natsConnection_Connect(&self->_connection, made);
    if (status == NATS_NOT_YET_CONNECTED) status = NATS_OK;
  }
  if (status == NATS_OK) status = natsConnection_JetStream(&self->_jetStream, self->_connection, nullptr);
  if (status != NATS_OK)
    return Failure{std::string("the stream's servers cannot be used: ") + natsStatus_GetText(status)};
  return self;
}

NATSConnection::~NATSConnection() {
  jsCtx_Destroy(_jetStream);
  if (!_connection) return;
  natsConnection_Close(_connection);
  _closed.get_future().wait_for(kLongestClose);
  natsConnection_Destroy(_connection);
}

bool NATSConnection::isOver() const {
  return natsConnection_IsClosed(_connection);
}

bool NATSConnection::connected() const {
  return natsConnection_Status(_connection) == NATS_CONN_STATUS_CONNECTED;
}

}  // namespace veltrad::gateway
