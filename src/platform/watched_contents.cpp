// SPDX-License-Identifier: Apache-2.0
// Keeps contents as property lists, because their size is known.
#include "platform/watched_contents.h"

#include <algorithm>
#include <new>

#include "base/property_list.h"

namespace veltrad::platform {

namespace {
// The size of a piece in memory and in an answer.
std::size_t sizeOf(const WatchedContents::Piece& piece) {
  constexpr std::size_t kBeside = 96;
  return piece.contents.capacity() + kBeside;
}
}  // namespace

std::unique_ptr<WatchedContents::Watch> WatchedContents::watch() {
  const Lock held(_mutex);
  _watching.fetch_add(1, std::memory_order_relaxed);
  return std::make_unique<Watch>(*this);
}

void WatchedContents::leaves() {
  const Lock held(_mutex);
  if (_watching.fetch_sub(1, std::memory_order_relaxed) > 1) return;
  _first += _pieces.size();
  _bytes = 0;
  std::deque<Piece>().swap(_pieces);
}

void WatchedContents::tryToPut(std::uint64_t message, const Dictionary* payload, const Dictionary* userInfo) {
  try {
    put(message, payload, userInfo);
  } catch (const std::bad_alloc&) {
    // The message itself goes on.
  }
}

void WatchedContents::put(std::uint64_t message, const Dictionary* payload, const Dictionary* userInfo) {
  Dictionary contents;
  if (payload) contents.set("payload", *payload);
  if (userInfo) contents.set("userInfo", *userInfo);
  Piece piece{message, writeBinaryPropertyList(contents)};
  if (piece.contents.size() > kMostOfOne) std::string().swap(piece.contents);
  const Lock held(_mutex);
  if (_watching.load(std::memory_order_relaxed) == 0) return;
  _pieces.push_back(std::move(piece));
  _bytes += sizeOf(_pieces.back());
  for (; _bytes > kMostBytes; ++_first) {
    _bytes -= sizeOf(_pieces.front());
    _pieces.pop_front();
  }
}

WatchedContents::Copy WatchedContents::copy(std::uint64_t from) const {
  const Lock held(_mutex);
  Copy result;
  result.next = std::clamp(from, _first, _first + _pieces.size());
  std::size_t bytes = 0;
  for (auto at = _pieces.begin() + static_cast<std::ptrdiff_t>(result.next - _first); at != _pieces.end();
       ++at, ++result.next) {
    bytes += sizeOf(*at);
    if (bytes > kMostOfOne && !result.pieces.empty()) break;
    result.pieces.push_back(*at);
  }
  return result;
}

std::uint64_t WatchedContents::next() const {
  const Lock held(_mutex);
  return _first + _pieces.size();
}

}  // namespace veltrad::platform
