// SPDX-License-Identifier: Apache-2.0
// Counts the pieces under way.
#include "gateway/piece_writer.h"

#include "base/text.h"
#include "platform/uuid.h"

namespace veltrad::gateway {

namespace {

std::string randomToken() {
  const auto bytes = platform::randomUUID();
  return hex({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
}

}  // namespace

std::string PieceWriter::place() const {
  return _token + " " + std::to_string(_offset);
}

void PieceWriter::add(std::string_view bytes) {
  while (!bytes.empty()) {
    // A full piece waits, because it may be the last one.
    if (_waiting.size() == kPieceBytes) publishPiece();
    const std::size_t part = std::min(bytes.size(), kPieceBytes - _waiting.size());
    _waiting.append(bytes.substr(0, part));
    bytes.remove_prefix(part);
  }
}

void PieceWriter::publishPiece() {
  _waiting.shrink_to_fit();
  std::string full = std::exchange(_waiting, {});
  // Where there is one piece there is another, so the room is not found by doubling it.
  _waiting.reserve(kPieceBytes);
  if (outcome() != Outcome::taken) return;
  if (_token.empty()) _token = randomToken();
  Message piece{subject::kPieces, "piece " + place(), {{header::kPiece, place()}}, std::move(full)};
  _offset += piece.body.size();
  {
    const Lock hold(_shared->mutex);
    ++_shared->underWay;
  }
  _shared->publisher.publish(std::move(piece),
                             [shared = _shared](Outcome outcome) { answered(shared, outcome); });
}

void PieceWriter::answered(const std::shared_ptr<Shared>& shared, Outcome outcome) {
  std::function<void()> resume, allTaken;
  {
    const Lock hold(shared->mutex);
    --shared->underWay;
    if (outcome != Outcome::taken) shared->outcome = outcome;
    resume = std::exchange(shared->resume, nullptr);
    if (shared->underWay == 0) allTaken = std::exchange(shared->allTaken, nullptr);
  }
  if (resume) resume();
  if (allTaken) allTaken();
}

bool PieceWriter::hasRoom(std::function<void()> resume) {
  const Lock hold(_shared->mutex);
  if (_shared->underWay < kMostPiecesUnderWay) return true;
  _shared->resume = std::move(resume);
  return false;
}

Outcome PieceWriter::outcome() const {
  const Lock hold(_shared->mutex);
  return _shared->outcome;
}

void PieceWriter::commit(Message last, Publisher::Completion done) {
  if (!_token.empty()) last.headers.emplace_back(header::kPiece, place());
  _waiting.shrink_to_fit();
  last.body = std::move(_waiting);
  auto publishLast = [shared = _shared, last = std::move(last), done = std::move(done)]() mutable {
    Outcome pieces;
    {
      const Lock hold(shared->mutex);
      pieces = shared->outcome;
    }
    if (pieces != Outcome::taken) return done(pieces);
    shared->publisher.publish(std::move(last), std::move(done));
  };
  {
    const Lock hold(_shared->mutex);
    if (_shared->underWay > 0) {
      _shared->allTaken = std::move(publishLast);
      return;
    }
  }
  publishLast();
}

void publishWhole(Publisher& publisher, Message message, Publisher::Completion done) {
  if (message.body.size() <= kPieceBytes) return publisher.publish(std::move(message), std::move(done));
  PieceWriter writer(publisher);
  const std::string body = std::exchange(message.body, {});
  writer.add(body);
  writer.commit(std::move(message), std::move(done));
}

}  // namespace veltrad::gateway
