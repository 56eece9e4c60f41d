// SPDX-License-Identifier: Apache-2.0
// Checks requests with the gate. HTTP thread.
#include "http/gatekeeper.h"

#include <map>
#include <new>
#include <string>
#include <utility>

namespace veltrad::http {

namespace {
std::optional<HTTPError> asError(std::optional<RequestRefusal> refused) {
  if (!refused) return std::nullopt;
  HTTPError error{HTTPError::Kind::refused, std::move(refused->text)};
  error.refusal = refused->reason;
  return error;
}
}  // namespace

std::optional<HTTPError> Gatekeeper::refusalOf(const CurlTransfer& transfer) const {
  if (_gate == nullptr) return std::nullopt;
  return asError(_gate->refusal(transfer.lane() == HTTPRequest::Lane::storebag, transfer.hostName()));
}

HTTPError Gatekeeper::refusedBefore(const CurlTransfer& transfer) const {
  try {
    auto error = refusalOf(transfer);
    return error ? std::move(*error)
                 : HTTPError{HTTPError::Kind::refused, "Refused by the owner of the device"};
  } catch (const std::bad_alloc&) {
    return CurlTransfer::outOfMemory();
  }
}

std::optional<HTTPError> Gatekeeper::overLimit(CurlTransfer& transfer) const {
  if (_gate == nullptr || transfer.lane() == HTTPRequest::Lane::storebag || !transfer.beginsFirst())
    return std::nullopt;
  Departure departure = transfer.departure();
  if (transfer.isAgain()) departure.events = 0;
  if (auto refused = asError(_gate->count(departure))) return refused;
  if (_gate->keepsRecords() && !transfer.isKept()) transfer.recordIn(*_gate, departure);
  return std::nullopt;
}

void Gatekeeper::ended(const CurlTransfer& transfer, const HTTPResult& result) const {
  if (_gate == nullptr || transfer.lane() == HTTPRequest::Lane::storebag) return;
  const bool refused = !result && result.error().kind == HTTPError::Kind::refused &&
                       result.error().refusal != wire::Reason::over_daily_limit;
  if (refused && !transfer.hasBegun()) _gate->refused(transfer.departure());
  if (transfer.record() == 0) return;
  DepartureEnd end;
  end.status = result ? result.value().status : result.error().status;
  if (!result) end.error = result.error().description;
  _gate->ended(transfer.record(), end);
}

// The gate is not asked under the queue's lock, so the hosts are collected first.
HTTPQueue::Transfers Gatekeeper::takeRefused(HTTPQueue& queue) const {
  using Key = std::pair<bool, std::string>;
  const auto keyOf = [](const CurlTransfer& transfer) {
    return Key(transfer.lane() == HTTPRequest::Lane::storebag, transfer.host());
  };
  std::map<Key, bool> refused;
  queue.take([&](const CurlTransfer& transfer) {
    refused.try_emplace(keyOf(transfer), false);
    return false;
  });
  for (auto& [key, is] : refused) is = _gate && _gate->refusal(key.first, hostName("https://" + key.second));
  return queue.take([&](const CurlTransfer& transfer) {
    const auto found = refused.find(keyOf(transfer));
    return found != refused.end() && found->second;
  });
}

}  // namespace veltrad::http
