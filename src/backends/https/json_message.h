// SPDX-License-Identifier: Apache-2.0
// The JSON text that is posted, and its readable copy.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace veltrad::backends {

// {"clientId": text, "events": [...], "postTime": seconds since 1970}, in pieces, which need not be joined to
// be compressed. A `postTime` that is not finite becomes -1.0.
class PostText {
 public:
  // The events are JSON texts.
  PostText(double postTime, const std::string& clientID, std::vector<std::string> events);

  // Valid until the text is changed or moved.
  std::vector<std::string_view> pieces() const;
  std::size_t size() const { return _size; }
  std::string joined() const;
  // With each field on a line of its own.
  std::string readable() const;

 private:
  std::string _begin;
  std::vector<std::string> _events;
  std::string _end;
  std::size_t _size;
};

struct JSONMessage {
  PostText text;
  // Only if it was requested.
  std::optional<std::string> pretty;
};

}  // namespace veltrad::backends
