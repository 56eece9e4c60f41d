// SPDX-License-Identifier: Apache-2.0
// Reads the stream in order, from a given place.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/result.h"
#include "gateway/nats_connection.h"

struct __natsSubscription;
struct __natsMsg;

namespace veltrad::gateway {

// A message as the stream has it. Headers that it does not have are empty.
struct StreamMessage {
  std::uint64_t seq = 0;
  // Nanoseconds since 1970.
  std::int64_t time = 0;
  // Without the prefix.
  std::string subject;
  std::string postID, via, reason, location, file, piece;
  std::string body;
};

struct StreamState {
  // Nanoseconds since 1970.
  std::int64_t created = 0;
  std::uint64_t firstSeq = 0;
  std::uint64_t lastSeq = 0;
};

// Used by one thread. The errors are one line and pass.
class StreamReader {
 public:
  static Result<std::unique_ptr<StreamReader>, std::string> open(StreamOptions options);
  ~StreamReader();

  Result<StreamState, std::string> state();
  // Only another reader can read.
  bool isOver() const { return _connection->isOver(); }
  // Reads what comes behind `seq`, through a consumer that is made for it.
  Result<Done, std::string> startBehind(std::uint64_t seq);
  // The next messages, at most `most` and about 32 MiB; none if nothing has come within a second. An error,
  // also one for a gap, asks for a new start.
  Result<std::vector<StreamMessage>, std::string> read(int most);
  // The time of the message at this place, in nanoseconds since 1970; absent: there is none.
  Result<std::optional<std::int64_t>, std::string> timeAt(std::uint64_t seq);
  // The stream may forget everything up to `seq`.
  Result<Done, std::string> purge(std::uint64_t seq);
  // The messages behind the last that was read.
  std::uint64_t behind() const { return _behind; }

 private:
  explicit StreamReader(StreamOptions options) : _options(std::move(options)) {}
  void leaveConsumer();
  std::optional<std::string> add(__natsMsg* message, std::vector<StreamMessage>& taken);

  const StreamOptions _options;
  std::unique_ptr<NATSConnection> _connection;
  __natsSubscription* _subscription = nullptr;
  // How many the consumer has delivered.
  std::uint64_t _delivered = 0;
  std::uint64_t _behind = 0;
};

}  // namespace veltrad::gateway
