// SPDX-License-Identifier: Apache-2.0
// Charges what the body keeps as it grows.
#include "gateway/buffered_body.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

namespace veltrad::gateway {

using support::Gunzip;

BufferedBody::BufferedBody(const HandlerServices& services, Charge charge, bool packed, std::uint64_t most)
    : _services(services), _most(most), _charge(std::move(charge)), _chargedWithoutText(_charge.bytes()) {
  if (packed) _gunzip.emplace(most);
}

// A string would double its room, whatever the bound is.
bool BufferedBody::keep(std::string_view bytes) {
  const std::size_t size = _text.size() + bytes.size();
  if (size > _text.capacity()) {
    const std::size_t room = std::max<std::size_t>(size, std::min<std::size_t>(2 * _text.capacity(), _most));
    if (!_charge.to(_chargedWithoutText + room)) return false;
    std::string larger;
    larger.reserve(room);
    _text = std::move(larger.append(_text));
  }
  _text.append(bytes);
  return true;
}

std::optional<Answer> BufferedBody::add(std::string_view& bytes) {
  const std::string_view given = bytes;
  bool room = true;
  auto state = Gunzip::State::open;
  if (_gunzip) {
    state = _gunzip->add(bytes, [&](std::string_view unpacked) { room = room && keep(unpacked); });
  } else {
    room = keep(bytes);
    bytes = {};
  }
  _received += given.size() - bytes.size();
  if (_received > _most)
    return _services.refusals.answer(
        {413, "too_large", fmt::format("a body here has at most {} bytes", _most)});
  if (!room) return _services.refusals.busy("no_room");
  if (state == Gunzip::State::open || state == Gunzip::State::ended) return std::nullopt;
  if (_text.empty()) _text = given.substr(0, Refusals::kMostKeptBytes);
  return _services.refusals.gzip(state, _most, _text);
}

std::optional<Answer> BufferedBody::end() {
  if (!_gunzip || _gunzip->state() == Gunzip::State::ended) return std::nullopt;
  return _services.refusals.gzip(_gunzip->state(), _most, _text);
}

std::string BufferedBody::take() {
  _text.shrink_to_fit();
  return std::exchange(_text, {});
}

bool BufferedBody::becomes(const Message& message) {
  _gunzip.reset();
  // An assignment of an empty text would leave it its memory.
  _text.clear();
  _text.shrink_to_fit();
  return _charge.to(message.bytes());
}

}  // namespace veltrad::gateway
