// SPDX-License-Identifier: Apache-2.0
// Answers the three requests.
#include "gateway/admin.h"

#include "gateway/metrics.h"

namespace veltrad::gateway {

namespace {
constexpr std::size_t kAdminStackBytes = 256u << 10;
constexpr std::size_t kMostAdminConnections = 64;
constexpr const char* kPlain = "text/plain; charset=utf-8";
}  // namespace

Admin::Admin(Questions questions)
    : _questions(std::move(questions)),
      _server([this](const RequestHead& head) { return answer(head); },
              {.connections = kMostAdminConnections}) {}

Admin::~Admin() {
  _server.end();
  _thread.join();
}

Result<std::string, std::string> Admin::start(const std::string& address) {
  auto bound = _server.listen(address);
  if (!bound) return bound;
  if (!_thread.start("admin", kAdminStackBytes, [this] { _server.run(); }))
    return Failure{std::string("a thread cannot be started")};
  return bound;
}

Answer Admin::answer(const RequestHead& head) const {
  const std::string_view path = head.target().substr(0, head.target().find('?'));
  if (path != "/live" && path != "/ready" && path != "/metrics") return {404, "", "", {}};
  if (head.method() != "GET") return {405, "", "", {{"Allow", "GET"}}};
  if (path == "/live") return {200, "alive\n", kPlain, {}};
  if (path == "/metrics") return {200, _questions.metrics(), kMetricsType, {}};
  const std::string why = _questions.notReady();
  return why.empty() ? Answer{200, "ready\n", kPlain, {}} : Answer{503, why + "\n", kPlain, {}};
}

}  // namespace veltrad::gateway
