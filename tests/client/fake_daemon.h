// A daemon's end of the wire for the library's tests: a real socket under a root of its own, and for each
// connection a thread that runs the test's script.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstring>
#include <filesystem>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "base/property_list.h"
#include "base/value.h"
#include "ipc/frame.h"

namespace veltrad::test {

struct ReceivedCall {
  std::uint32_t id = 0;
  std::string op;
  Dictionary args;
};

// One connection, used by the script's thread; reply(), event() and hangUp() by any.
class Link {
 public:
  explicit Link(int socket) : _socket(socket) {
    const timeval patience{20, 0};
    ::setsockopt(_socket, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    ::setsockopt(_socket, SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
  }
  ~Link() { ::close(_socket); }
  Link(const Link&) = delete;

  // The next frame, or nothing at the end of the connection.
  std::optional<ipc::FrameHeader> nextFrame(Dictionary& body) {
    ipc::Frame frame;
    for (;;) {
      const auto next = _reader.next(frame);
      if (next == ipc::FrameReader::Next::impossible) return std::nullopt;
      if (next == ipc::FrameReader::Next::frame) {
        const auto parsed = parseBinaryPropertyList(frame.body);
        if (!parsed || !parsed.value().asDictionary()) return std::nullopt;
        body = *parsed.value().asDictionary();
        return frame.header;
      }
      const auto [bytes, room] = _reader.room();
      const ssize_t count = ::recv(_socket, bytes, room, 0);
      if (count <= 0) return std::nullopt;
      _reader.received(static_cast<std::size_t>(count));
    }
  }

  // Reads the client's hello and answers it.
  bool greet() {
    Dictionary hello;
    const auto header = nextFrame(hello);
    if (!header || header->kind != ipc::FrameKind::hello || hello.uint32("wire") != ipc::kWireVersion)
      return false;
    return send(ipc::makeFrame(ipc::FrameKind::hello, 0, Dictionary{{"wire", 1}, {"daemon", "8.0"}}));
  }

  std::optional<ReceivedCall> nextCall() {
    Dictionary body;
    const auto header = nextFrame(body);
    if (!header || header->kind != ipc::FrameKind::call) return std::nullopt;
    ReceivedCall call;
    call.id = header->callID;
    if (const std::string* op = body.string("op")) call.op = *op;
    if (const Dictionary* args = body.dictionary("args")) call.args = *args;
    return call;
  }

  bool send(std::string_view bytes) {
    const std::lock_guard held(_sending);
    while (!bytes.empty()) {
      const ssize_t count = ::send(_socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }
  bool reply(std::uint32_t id, Dictionary results) {
    return send(ipc::makeFrame(ipc::FrameKind::reply, id, Dictionary{{"results", std::move(results)}}));
  }
  bool replyError(std::uint32_t id, Dictionary error) {
    return send(ipc::makeFrame(ipc::FrameKind::reply, id, Dictionary{{"error", std::move(error)}}));
  }
  bool event(Dictionary args) {
    return send(ipc::makeFrame(ipc::FrameKind::event, 0,
                               Dictionary{{"op", "sendMessageToClient:timestamp:category:type:payload:"},
                                          {"args", std::move(args)}}));
  }
  void hangUp() { ::shutdown(_socket, SHUT_RDWR); }
  int socket() const { return _socket; }

 private:
  const int _socket;
  std::mutex _sending;
  ipc::FrameReader _reader;
};

// A directory of its own, with run/veltrad in it.
class TemporaryRoot {
 public:
  TemporaryRoot() {
    std::string name = (std::filesystem::temp_directory_path() / "veltra-client-XXXXXX").string();
    if (!::mkdtemp(name.data())) throw std::runtime_error("no temporary directory");
    _path = name;
    std::filesystem::create_directories(_path + "/run/veltrad");
  }
  ~TemporaryRoot() { std::filesystem::remove_all(_path); }
  const std::string& path() const { return _path; }
  std::string socketPath() const { return _path + "/run/veltrad/com.florn.veltrad.sock"; }

 private:
  std::string _path;
};

inline int boundSocket(const std::string& path, int type, bool listening) {
  const int made = ::socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  if (::bind(made, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0)
    throw std::runtime_error("bind");
  if (listening && ::listen(made, 64) != 0) throw std::runtime_error("listen");
  return made;
}

class FakeDaemon {
 public:
  using Script = std::function<void(Link&)>;

  explicit FakeDaemon(Script script)
      : _script(std::move(script)), _listener(boundSocket(_root.socketPath(), SOCK_STREAM, true)) {
    _accepting = std::thread([this] { accept(); });
  }
  ~FakeDaemon() {
    ::shutdown(_listener, SHUT_RDWR);
    _accepting.join();
    for (const auto& link : _links) link->hangUp();
    for (std::thread& thread : _threads) thread.join();
    ::close(_listener);
  }
  const std::string& root() const { return _root.path(); }
  std::string socketPath() const { return _root.socketPath(); }

 private:
  void accept() {
    for (;;) {
      const int socket = ::accept4(_listener, nullptr, nullptr, SOCK_CLOEXEC);
      if (socket < 0) return;
      _links.push_back(std::make_unique<Link>(socket));
      Link* link = _links.back().get();
      _threads.emplace_back([this, link] {
        _script(*link);
        link->hangUp();
      });
    }
  }

  TemporaryRoot _root;
  const Script _script;
  const int _listener;
  std::thread _accepting;
  std::vector<std::unique_ptr<Link>> _links;  // the accepting thread's until it has ended
  std::vector<std::thread> _threads;
};

// Greets, keeps what describes the session, and answers every call by `answer` until the client goes.
inline FakeDaemon::Script answering(std::function<void(Link&, const ReceivedCall&)> answer) {
  return [answer](Link& link) {
    if (!link.greet()) return;
    while (const auto call = link.nextCall()) answer(link, *call);
  };
}

// Answers a send with "CATEGORY/TYPE", a start with two names, the rest by kind.
inline void answerPlainly(Link& link, const ReceivedCall& call) {
  if (call.id == 0) return;
  if (call.op == "startConfigWithCompletionHandler:" ||
      call.op == "fetchStatesWithUserInfo:completionHandler:") {
    link.reply(call.id, Dictionary{{"backends", Array{"dashboard", "httppost"}}});
  } else if (call.op == "sendMessageWithCategory:type:payload:reply:") {
    link.reply(call.id, Dictionary{{"reply", std::to_string(*call.args.uint16("category")) + "/" +
                                                 std::to_string(*call.args.uint16("type"))}});
  } else if (call.op == "fetchDisplayURL:") {
    link.reply(call.id, Dictionary{{"reply", "URL not available"}});
  } else {
    link.reply(call.id, Dictionary{});
  }
}

}  // namespace veltrad::test
