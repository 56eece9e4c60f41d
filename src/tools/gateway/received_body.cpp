// SPDX-License-Identifier: Apache-2.0
// Charges the budget as the body grows.
#include "gateway/received_body.h"

#include <fmt/format.h>

namespace veltrad::gateway {

using support::Gunzip;

Refusal refusalOf(Gunzip::State state, std::uint64_t most) {
  switch (state) {
    case Gunzip::State::tail:
      return {400, "gzip", "bytes follow the gzip stream"};
    case Gunzip::State::tooLarge:
      return {413, "too_large", fmt::format("the body unpacks to more than {} bytes", most)};
    case Gunzip::State::open:
      return {400, "gzip", "the gzip stream is cut short"};
    default:
      return {400, "gzip", "it is no gzip stream"};
  }
}

ReceivedBody::ReceivedBody(const DoorServices& services, bool packed, std::uint64_t most)
    : _services(services), _most(most) {
  if (packed) _gunzip.emplace(most);
}

ReceivedBody::~ReceivedBody() {
  _services.budget.give(_charged);
}

bool ReceivedBody::grow(std::size_t bytes) {
  if (!_services.budget.take(bytes)) return false;
  _charged += bytes;
  return true;
}

Answer ReceivedBody::refusedGzip(Gunzip::State state) {
  if (state == Gunzip::State::shortage) return _services.refusals.busy("no_memory");
  const Refusal refusal = refusalOf(state, _most);
  return refusal.status == 400 ? _services.refusals.malformed(refusal.reason, refusal.detail, _text)
                               : _services.refusals.answer(refusal);
}

std::optional<Answer> ReceivedBody::add(std::string_view bytes) {
  _received += bytes.size();
  if (_received > _most)
    return _services.refusals.answer(
        {413, "too_large", fmt::format("a body here has at most {} bytes", _most)});
  bool room = true;
  if (!_gunzip) {
    room = grow(bytes.size());
    if (room) _text.append(bytes);
  } else {
    const auto state = _gunzip->add(bytes, [&](std::string_view unpacked) {
      room = room && grow(unpacked.size());
      if (room) _text.append(unpacked);
    });
    if (room && state != Gunzip::State::open && state != Gunzip::State::ended) {
      if (_text.empty()) _text = bytes.substr(0, Refusals::kMostKeptBytes);
      return refusedGzip(state);
    }
  }
  if (!room) return _services.refusals.busy("no_room");
  return std::nullopt;
}

std::optional<Answer> ReceivedBody::end() {
  if (_gunzip && _gunzip->state() != Gunzip::State::ended) return refusedGzip(_gunzip->state());
  // The body may be held for long.
  _gunzip.reset();
  if (_text.capacity() > _text.size() + _text.size() / 4) _text.shrink_to_fit();
  return std::nullopt;
}

}  // namespace veltrad::gateway
