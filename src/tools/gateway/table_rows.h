// SPDX-License-Identifier: Apache-2.0
// Rows of the tables in COPY's text format.
#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "gateway/envelope.h"
#include "gateway/stream_reader.h"

namespace veltrad::gateway {

// Writes one row behind those that are there, column by column.
class CopyRow {
 public:
  explicit CopyRow(std::string& out) : _out(out) {
    if (!_out.empty()) _out += '\n';
  }
  CopyRow(const CopyRow&) = delete;

  CopyRow& text(std::string_view text);
  CopyRow& textIf(const std::optional<std::string>& value) { return value ? text(*value) : null(); }
  CopyRow& number(std::int64_t number);
  CopyRow& numberIf(std::optional<std::int32_t> value) { return value ? number(*value) : null(); }
  // Nanoseconds since 1970.
  CopyRow& time(std::int64_t nanoseconds);
  CopyRow& bytes(std::string_view bytes);
  CopyRow& texts(const std::vector<std::string>& texts);
  CopyRow& null();

 private:
  void begin();

  std::string& _out;
  bool _first = true;
};

// "2026-11-26 03:46:00.123456+00"
std::string timestampText(std::int64_t nanoseconds);
// "2026-11-26"
std::string dayText(std::int64_t nanoseconds);

// The rows that a batch of messages becomes.
struct TableRows {
  std::string events, datagrams, files, logData, refused, posts;
  std::uint64_t eventCount = 0;
  // The days of the events, "2026-11-26".
  std::set<std::string> days;

  std::size_t bytes() const;
  // Forgets the rows; the count and the days stay.
  void clear();

  // Each adds the rows of one message; the error says why it has none. `body` is the message's whole body.
  Result<Done, std::string> addEvents(const StreamMessage& message, std::string body);
  Result<Done, std::string> addDatagram(const StreamMessage& message);
  Result<Done, std::string> addLogData(const StreamMessage& message, std::string body);
  Result<Done, std::string> addFile(const StreamMessage& message, const std::string& path);
  void addRefused(const StreamMessage& message, const std::string& reason);
};

}  // namespace veltrad::gateway
