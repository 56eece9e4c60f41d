// SPDX-License-Identifier: Apache-2.0
// The format of messages in the stream: subjects, headers, messages.
#pragma once

#include <string>
#include <utility>
#include <vector>

namespace veltrad::gateway {

// Each begins with the stream's own prefix ("veltra.", an option).
namespace subject {
// The body is an envelope as a device has posted it, unpacked.
inline constexpr const char* kEvents = "events";
// The body is the datagram as a JSON object.
inline constexpr const char* kDatagrams = "datagrams";
// The body is the file, a gzip stream, or its last piece.
inline constexpr const char* kFiles = "files";
// The body is a JSON array.
inline constexpr const char* kLogData = "logdata";
// The body is what was refused, or its beginning.
inline constexpr const char* kRefused = "refused";
// The body is a piece of a body that is too large for one message.
inline constexpr const char* kPieces = "pieces";
}  // namespace subject

namespace header {
// The stream keeps one of all messages with the same ID that come within two minutes.
inline constexpr const char* kMessageID = "Nats-Msg-Id";
// X-VLT-Post-ID, where the device has sent one.
inline constexpr const char* kPostID = "Veltra-Post-ID";
// The label in the path of a post.
inline constexpr const char* kVia = "Veltra-Via";
// Why something was refused.
inline constexpr const char* kReason = "Veltra-Reason";
// Where log data is said to be.
inline constexpr const char* kLocation = "Veltra-Location";
// The metadata of a file, as a JSON object.
inline constexpr const char* kFile = "Veltra-File";
// "TOKEN OFFSET": the body is to be written there. In any message but a piece: the body is the last piece.
inline constexpr const char* kPiece = "Veltra-Piece";
}  // namespace header

struct Message {
  // Without the prefix.
  std::string subject;
  // Its message ID.
  std::string id;
  std::vector<std::pair<std::string, std::string>> headers;
  std::string body;

  // The approximate memory that it uses.
  std::size_t bytes() const {
    std::size_t bytes = body.size() + id.size() + 256;
    for (const auto& [name, text] : headers) bytes += name.size() + text.size();
    return bytes;
  }
};

}  // namespace veltrad::gateway
