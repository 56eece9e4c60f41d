// SPDX-License-Identifier: Apache-2.0
// Publishes a body of any size: one that is too large for one message in pieces, of which the last commits
// it.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "gateway/publisher.h"

namespace veltrad::gateway {

// Less than 1 MiB, which a server of the stream takes unless it is told otherwise.
inline constexpr std::size_t kPieceBytes = 960u << 10;
// The number of unconfirmed pieces of one body.
inline constexpr std::size_t kMostPiecesUnderWay = 2;

// One thread adds and commits; answers come on others. The publisher must outlive it.
class PieceWriter {
 public:
  explicit PieceWriter(Publisher& publisher) : _shared(std::make_shared<Shared>(publisher)) {}

  // Publishes each piece when it is full, as long as the stream has taken those before.
  void add(std::string_view bytes);
  // False: several pieces wait for the stream. `resume` is then called once, when fewer do.
  bool hasRoom(std::function<void()> resume);
  // The worst outcome of the pieces so far.
  Outcome outcome() const;
  // `last` has everything except the body. `done` gets the outcome of the whole body. The last piece is
  // published only after the stream has confirmed all others.
  void commit(Message last, Publisher::Completion done);

 private:
  struct Shared {
    explicit Shared(Publisher& to) : publisher(to) {}

    Publisher& publisher;
    Mutex mutex LEAF_LOCK{LockRank::leaf};
    std::size_t underWay GUARDED_BY(mutex) = 0;
    // The worst of the pieces so far.
    Outcome outcome GUARDED_BY(mutex) = Outcome::taken;
    std::function<void()> resume GUARDED_BY(mutex);
    std::function<void()> allTaken GUARDED_BY(mutex);
  };
  static void answered(const std::shared_ptr<Shared>& shared, Outcome outcome);
  std::string place() const;
  void publishPiece();

  const std::shared_ptr<Shared> _shared;
  // Made with the first piece.
  std::string _token;
  std::string _waiting;
  std::uint64_t _offset = 0;
};

// The whole body of the message, in pieces if it must be.
void publishWhole(Publisher& publisher, Message message, Publisher::Completion done);

}  // namespace veltrad::gateway
