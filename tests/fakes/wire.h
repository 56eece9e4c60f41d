// SPDX-License-Identifier: Apache-2.0
// One end of the wire protocol on a bare socket, for tests of both sides, and helpers for their threads.
#pragma once

#include <gtest/gtest.h>
#include <linux/sockios.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "base/property_list.h"
#include "fakes/unix_socket.h"
#include "formats/json.h"
#include "platform/root.h"
#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad {

namespace operation = wire::operation;
inline constexpr std::chrono::seconds kPatience{20};

// What happened, in order. Any thread.
class Journal {
 public:
  void add(std::string line) {
    std::lock_guard lock(_mutex);
    _lines.push_back(std::move(line));
    _came.notify_all();
  }
  bool waitForLines(std::size_t count) {
    return waitUntil([&] { return _lines.size() >= count; });
  }
  bool waitFor(const std::string& line) {
    return waitUntil([&] { return std::find(_lines.begin(), _lines.end(), line) != _lines.end(); });
  }
  std::vector<std::string> lines() const {
    std::lock_guard lock(_mutex);
    return _lines;
  }

 private:
  template <typename Predicate>
  bool waitUntil(Predicate predicate) {
    std::unique_lock lock(_mutex);
    return _came.wait_for(lock, kPatience, predicate);
  }
  mutable std::mutex _mutex;
  std::condition_variable _came;
  std::vector<std::string> _lines;
};

// Blocks threads until another thread opens it.
class Gate {
 public:
  void open() { _journal.add("open"); }
  void pass() { EXPECT_TRUE(_journal.waitForLines(1)); }

 private:
  Journal _journal;
};

// A root of its own, with the run directory in it.
class TemporaryRoot : private TemporaryDirectory, public platform::Root {
 public:
  using platform::Root::path;
  TemporaryRoot() : platform::Root(TemporaryDirectory::path()) {
    std::filesystem::create_directories(runDirectory());
  }
};

// A header with any body behind it, and any length in it.
inline std::string rawFrame(wire::FrameKind kind, std::string_view body,
                            std::optional<std::size_t> length = {}, std::uint8_t descriptors = 0,
                            std::uint32_t callID = 9) {
  std::string bytes(wire::kFrameHeaderBytes, '\0');
  const auto declared = static_cast<std::uint32_t>(length.value_or(body.size()));
  wire::encodeFrameHeader({declared, kind, descriptors, callID}, bytes.data());
  return bytes.append(body);
}

struct Received {
  wire::FrameKind kind{};
  std::uint32_t callID = 0;
  Dictionary body;

  std::string op() const { return body.string("op") ? *body.string("op") : ""; }
  Dictionary args() const { return body.dictionary("args") ? *body.dictionary("args") : Dictionary{}; }
  std::string description() const {
    const Dictionary* error = body.dictionary("error");
    return error && error->string("description") ? *error->string("description") : "";
  }
  // As JSON, or what the error says.
  std::string results() const {
    const Value* found = body.find("results");
    return found ? formats::writeJSON(*found) : description();
  }
};

// Frames from a bare socket and bytes to it. One thread, but for hangUp().
class WireEnd {
 public:
  explicit WireEnd(FileDescriptor socket) : _socket(std::move(socket)) {
    const timeval patience{kPatience.count(), 0};
    ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    ::setsockopt(_socket.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
  }

  // False: the other side takes no more.
  bool send(std::string_view bytes, const std::vector<int>& descriptors = {}) {
    while (!bytes.empty()) {
      iovec part{const_cast<char*>(bytes.data()), bytes.size()};
      msghdr message{};
      message.msg_iov = &part;
      message.msg_iovlen = 1;
      alignas(cmsghdr) char control[CMSG_SPACE(32 * sizeof(int))] = {};
      if (!descriptors.empty()) {
        message.msg_control = control;
        message.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        *header = {CMSG_LEN(descriptors.size() * sizeof(int)), SOL_SOCKET, SCM_RIGHTS};
        std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size() * sizeof(int));
      }
      const ssize_t count = ::sendmsg(_socket.get(), &message, MSG_NOSIGNAL);
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }
  // Nothing: the end, or no readable frame in time.
  std::optional<Received> receive() {
    wire::Frame frame;
    while (_reader.next(frame) == wire::FrameReader::Next::needMore) {
      const auto [place, size] = _reader.room();
      const ssize_t count = ::recv(_socket.get(), place, size, 0);
      _ended = count == 0 || (count < 0 && errno == ECONNRESET);
      if (count <= 0) return std::nullopt;
      _reader.received(static_cast<std::size_t>(count));
    }
    const auto parsed = parseBinaryPropertyList(frame.body);
    if (!parsed || !parsed.value().asDictionary()) return std::nullopt;
    return Received{frame.header.kind, frame.header.callID, *parsed.value().asDictionary()};
  }
  // A frame must come.
  Received next() {
    auto received = receive();
    EXPECT_TRUE(received) << "no frame came";
    return std::move(received).value_or(Received{});
  }
  // The other side has closed, and nothing more was to be read.
  bool atEnd() { return !receive() && _ended; }
  // Until the other side has read everything that was sent.
  void waitUntilRead() {
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    int unread = 1;
    while (::ioctl(_socket.get(), SIOCOUTQ, &unread) == 0 && unread > 0) {
      ASSERT_LT(std::chrono::steady_clock::now(), deadline);
      std::this_thread::yield();
    }
  }
  void hangUp(int how = SHUT_RDWR) { ::shutdown(_socket.get(), how); }
  void close() { _socket.reset(); }

 private:
  FileDescriptor _socket;
  wire::FrameReader _reader;
  bool _ended = false;
};

}  // namespace veltrad
