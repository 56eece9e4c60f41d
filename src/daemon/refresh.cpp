// SPDX-License-Identifier: Apache-2.0
// Converts the answer of a fetch for the control socket.
#include "daemon/refresh.h"

#include <fmt/format.h>

#include "base/null_value.h"
#include "base/text.h"
#include "config/client_types.h"
#include "config/storebag_source.h"
#include "daemon/storebag_cache.h"

namespace veltrad::daemon {

namespace {

const char* resultOf(const config::StorebagAnswer& answer) {
  using Cause = config::StorebagCause;
  switch (answer.cause) {
    case Cause::none:
      return "fetched";
    case Cause::noStorebag:
      return answer.status >= 400 ? "failed" : "refused";
    case Cause::publicKey:
    case Cause::signature:
    case Cause::content:
    case Cause::refused:
    case Cause::noSection:
      return "refused";
    default:
      return "failed";
  }
}

Value reasonOf(const config::StorebagAnswer& answer) {
  if (answer.cause == config::StorebagCause::none) return nullValue();
  return answer.status >= 400 ? fmt::format("HTTP {}: {}", answer.status, answer.why) : answer.why;
}

std::string unknownName(const std::string& name) {
  std::string line =
      fmt::format("unknown storebag \"{}\": expected one of", escapedForLog(name.substr(0, 100)));
  const char* before = " ";
  for (const std::string& known : config::storebagNames()) {
    line += before + known;
    before = ", ";
  }
  return line;
}

}  // namespace

Result<Dictionary, std::string> refreshStorebag(StorebagCache& cache, const std::string& name) {
  const auto clientType = config::clientTypeWithStorebag(name);
  if (!clientType) return Failure{unknownName(name)};
  const config::StorebagAnswer answer = cache.refresh(*clientType);
  const auto version = cache.versionForClientType(*clientType);
  return Dictionary{{"name", name},
                    {"result", resultOf(answer)},
                    {"signature", answer.genuine ? Value(*answer.genuine ? "good" : "bad") : nullValue()},
                    {"reason", reasonOf(answer)},
                    {"version", orNull(version)}};
}

}  // namespace veltrad::daemon
