// SPDX-License-Identifier: Apache-2.0
// Makes answers without a body, because a daemon may take any body for a receipt.
#include "gateway/refusals.h"

#include <fmt/format.h>

#include "base/text.h"
#include "platform/uuid.h"

namespace veltrad::gateway {

namespace {

constexpr const char* kRefusedHeader = "X-VLT-Refused";
constexpr std::size_t kMostDetailBytes = 512;
// Seconds; the random part spreads the repeated requests.
constexpr unsigned kRetryAfter = 5;
constexpr unsigned kRetrySpread = 10;

// A header takes no control characters, and few servers take others than ASCII.
std::string asHeader(const std::string& text) {
  std::string out;
  for (const char c : escapedForLog(text).substr(0, kMostDetailBytes)) out += c >= ' ' && c <= '~' ? c : '?';
  return out;
}

}  // namespace

bool KeepingRate::allows(Time now) {
  if (!_second || now >= *_second + std::chrono::seconds(1)) {
    _second = now;
    _kept = 0;
  }
  return _kept++ < kMostASecond;
}

bool Refusals::isKept() {
  const Lock hold(_mutex);
  return _rate.allows(std::chrono::steady_clock::now());
}

Answer Refusals::answer(const Refusal& refusal) {
  Answer answer{refusal.status, "", "", {{kRefusedHeader, asHeader(refusal.detail)}}};
  if (refusal.status == 405) answer.headers.emplace_back("Allow", "POST");
  _metrics.refused.add(refusal.reason);
  return answer;
}

Answer Refusals::malformed(const char* reason, const std::string& detail, std::string_view body) {
  if (isKept()) {
    Message message{
        subject::kRefused,
        "refused " + platform::randomUUIDText(),
        {{header::kReason, escapedForLog(std::string(reason) + ": " + detail).substr(0, kMostDetailBytes)}},
        std::string(body.substr(0, kMostKeptBytes))};
    _publisher.publish(std::move(message), [](Outcome) {});
  }
  return answer({400, reason, std::string(reason) + ": " + detail});
}

Answer Refusals::gzip(support::Gunzip::State state, std::uint64_t most, std::string_view body) {
  switch (state) {
    case support::Gunzip::State::shortage:
      return busy("no_memory");
    case support::Gunzip::State::tooLarge:
      return answer(
          {413, "too_large",
           fmt::format("the body unpacks to more than {} bytes, or to far more than what came", most)});
    case support::Gunzip::State::tail:
      return malformed("gzip", "bytes follow the gzip stream", body);
    case support::Gunzip::State::open:
      return malformed("gzip", "the gzip stream is cut short", body);
    default:
      return malformed("gzip", "it is no gzip stream", body);
  }
}

Answer Refusals::busy(const char* reason) {
  const unsigned spread = platform::randomUUID()[0] % kRetrySpread;
  Answer answer{
      _shed, "", "", {{kRefusedHeader, reason}, {"Retry-After", std::to_string(kRetryAfter + spread)}}};
  _metrics.refused.add(reason);
  return answer;
}

}  // namespace veltrad::gateway
