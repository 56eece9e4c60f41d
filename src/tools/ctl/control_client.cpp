// SPDX-License-Identifier: Apache-2.0
// Sends one call at a time and waits for its reply.
#include "tools/ctl/control_client.h"

#include <fmt/format.h>
#include <sys/socket.h>

#include "base/property_list.h"
#include "wire/error.h"
#include "wire/limits.h"
#include "wire/names.h"
#include "wire/socket_path.h"

namespace veltrad::ctl {

namespace key = wire::key;

Result<ControlClient, std::string> ControlClient::connect(const std::optional<std::string>& root) {
  auto daemon =
      client::reachDaemon(wire::controlSocketPathUnder(root ? *root : wire::rootFromEnvironment()), "");
  if (!daemon) return Failure{std::move(daemon.error().text)};
  return ControlClient(std::move(daemon.value()));
}

Result<Dictionary, std::string> ControlClient::ask(const char* question, Dictionary arguments,
                                                   std::chrono::seconds patience) {
  const auto deadline = std::chrono::steady_clock::now() + patience;
  const std::string call =
      wire::makeFrame(wire::FrameKind::call, ++_lastCall,
                      {{key::kOperation, question}, {key::kArguments, std::move(arguments)}});
  // Small beside a socket's buffer, so that it is taken whole; if not, the daemon has gone.
  if (::send(_daemon.socket.get(), call.data(), call.size(), MSG_NOSIGNAL) !=
      static_cast<ssize_t>(call.size())) {
    return Failure{std::string("veltrad ended the connection: start it again, or see its log.")};
  }
  auto body = reply(deadline);
  if (!body) {
    return Failure{fmt::format(
        "veltrad gave no answer to \"{}\" within {} s, or ended: see its log, and whether it runs.", question,
        patience.count())};
  }
  if (const Dictionary* error = body->dictionary(key::kError)) {
    return Failure{wire::errorOfDictionary(*error).description};
  }
  auto results = body->take(key::kResults);
  auto dictionary = results ? std::move(*results).takeDictionary() : std::nullopt;
  if (!dictionary) return Failure{fmt::format("veltrad answered \"{}\" with no results.", question)};
  return std::move(*dictionary);
}

std::optional<Dictionary> ControlClient::reply(std::chrono::steady_clock::time_point deadline) {
  wire::Frame frame;
  do {
    if (client::receiveFrame(_daemon, deadline, frame) != client::Received::frame) return std::nullopt;
  } while (frame.header.kind == wire::FrameKind::event);
  auto parsed = parseBinaryPropertyList(frame.body, wire::kDaemonFrameLimits);
  return parsed ? std::move(parsed.value()).takeDictionary() : std::nullopt;
}

}  // namespace veltrad::ctl
