// SPDX-License-Identifier: Apache-2.0
// A post in the spool: the form of its file, and the reader of that. Pure functions; any thread.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/value.h"

namespace veltrad::support {

// The ID of a post, the same for each transmission.
using PostID = std::array<unsigned char, 16>;
PostID newPostID();
// 32 lower-case hexadecimal digits, and back.
std::string textOf(const PostID& id);
std::optional<PostID> postIDOf(std::string_view text);

// A post as it is to be sent, its owner, and the data that decides whether it may leave. Its 14 fields are
// the keys of the file.
struct SpoolEntry {
  PostID id{};
  // When it was made, in microseconds since 1970; no two posts of a daemon have the same.
  std::uint64_t order = 0;
  std::string url;
  std::vector<std::pair<std::string, std::string>> headers;
  std::string body;
  std::uint32_t events = 0;
  std::uint32_t uid = 0;
  std::uint32_t connection = 0;
  // The session requires user info, so that consent and the client entry decide.
  bool asksEntry = false;
  // As in http::Departure; the names in `client` are those that may leave.
  Dictionary client;
  Dictionary about;
  // The owner withholds a name that chooses the client entry.
  bool namesHidden = false;
  // Before it was written: how often it was sent, and what went wrong last.
  std::uint16_t tries = 0;
  std::string lastError;

  std::string text(const char* key) const;
  std::int32_t clientType() const { return client.int32("clientType").value_or(-1); }
};

// A name of a version, a binary property list, and the CRC-32 of both, big-endian.
std::string writeSpoolEntry(const SpoolEntry& entry);
// Nothing: it is damaged, or no such file.
std::optional<SpoolEntry> readSpoolEntry(std::string_view file);
// Reads the content between the version name and the checksum.
std::optional<SpoolEntry> readSpoolContent(std::string_view content);

}  // namespace veltrad::support
