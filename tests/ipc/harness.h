// A daemon's door with a recording session behind it, and a client at a bare socket before it.
#pragma once

#include <gtest/gtest.h>
#include <linux/sockios.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <thread>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "ipc/frame.h"
#include "ipc/listener.h"
#include "protocol/constants.h"

namespace veltrad::ipc_test {

using namespace std::chrono_literals;
using ipc::FrameKind;

inline constexpr auto kPatience = 20s;
inline std::chrono::steady_clock::time_point soon() {
  return std::chrono::steady_clock::now() + kPatience;
}

// What happened, in order; any thread adds.
class Journal {
 public:
  void add(std::string line) {
    std::lock_guard lock(_mutex);
    _lines.push_back(std::move(line));
    _came.notify_all();
  }
  bool waitForLines(std::size_t count) {
    std::unique_lock lock(_mutex);
    return _came.wait_for(lock, kPatience, [&] { return _lines.size() >= count; });
  }
  bool waitFor(const std::string& line) {
    std::unique_lock lock(_mutex);
    return _came.wait_for(lock, kPatience,
                          [&] { return std::find(_lines.begin(), _lines.end(), line) != _lines.end(); });
  }
  std::vector<std::string> lines() const {
    std::lock_guard lock(_mutex);
    return _lines;
  }

 private:
  mutable std::mutex _mutex;
  std::condition_variable _came;
  std::vector<std::string> _lines;
};

// A gate that a call waits at until the test opens it.
class Gate {
 public:
  void open() {
    std::lock_guard lock(_mutex);
    _open = true;
    _changed.notify_all();
  }
  void pass() {
    std::unique_lock lock(_mutex);
    EXPECT_TRUE(_changed.wait_for(lock, kPatience, [&] { return _open; }));
  }

 private:
  std::mutex _mutex;
  std::condition_variable _changed;
  bool _open = false;
};

inline std::string textOf(const Value& value) {
  if (const auto* dictionary = value.asDictionary()) {
    std::string text = "{";
    for (const auto& [key, held] : *dictionary)
      text += (text.size() > 1 ? " " : "") + key + "=" + textOf(held);
    return text + "}";
  }
  if (const auto* array = value.asArray()) {
    std::string text = "[";
    for (const auto& held : *array) text += (text.size() > 1 ? " " : "") + textOf(held);
    return text + "]";
  }
  if (value.isBoolean()) return *value.toBoolean() ? "true" : "false";
  return value.toText().value_or("?");
}
template <typename T>
std::string textOf(const std::optional<T>& value) {
  return value ? textOf(Value(*value)) : "none";
}

// Writes each call into the journal with its arguments as text and answers "NAME done".
class RecordingSession final : public ClientSessionInterface {
 public:
  explicit RecordingSession(Journal& journal) : _journal(journal) {}

  // In place of the answer to a message, when set.
  std::function<void(std::uint16_t category, StringReply)> onMessage;

  void setSessionInfo(OptionalDictionary sessionInfo, OptionalDictionary userInfo,
                      std::optional<Array> frameworks, bool hasAggregationBlock) override {
    _journal.add("setSessionInfo " + textOf(sessionInfo) + " " + textOf(userInfo) + " " + textOf(frameworks) +
                 (hasAggregationBlock ? " aggregating" : ""));
  }
  void startConfigWithCompletionHandler(NamesReply reply) override {
    _journal.add("startConfig");
    if (reply) reply(std::vector<std::string>{"httppost", "dashboard"});
  }
  void fetchStatesWithUserInfo(OptionalDictionary userInfo, NamesReply reply) override {
    _journal.add("fetchStates " + textOf(userInfo));
    if (reply) reply(std::nullopt);
  }
  void fetchDisplayURL(StringReply reply) override { answer("fetchDisplayURL", std::move(reply)); }
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, OptionalDictionary payload,
                               StringReply reply) override {
    const std::string line =
        "sendMessage " + std::to_string(category) + " " + std::to_string(type) + " " + textOf(payload);
    if (!onMessage) return answer(line, std::move(reply));
    _journal.add(line);
    onMessage(category, std::move(reply));
  }
  void sendMessageWithDictionary(Dictionary message, StringReply reply) override {
    answer("sendDictionary " + textOf(Value(message)), std::move(reply));
  }
  void flushMessagesWithCompletion(FlushReply reply) override {
    _journal.add("flush");
    if (reply) reply("flushed", makeReportingError("No backends available to send message", -1));
  }
  void finishSessionWithReply(StringReply reply) override { answer("finish", std::move(reply)); }
  void uploadFileAtPath(std::string path, std::string token, BooleanReply reply) override {
    _journal.add("uploadFile " + path + " token '" + token + "'");
    if (reply) reply(true);
  }
  void uploadLogData(Array logData, UploadLogDataReply reply) override {
    _journal.add("uploadLogData of " + std::to_string(logData.size()));
    if (reply) reply(false, makeReportingError("refused", 403));
  }
  void sendMessageWithSessionInfo(OptionalDictionary sessionInfo, OptionalDictionary userInfo,
                                  std::uint16_t category, std::uint16_t type, OptionalDictionary payload,
                                  StringReply reply) override {
    answer("oneShot " + textOf(sessionInfo) + " " + textOf(userInfo) + " " + std::to_string(category) + " " +
               std::to_string(type) + " " + textOf(payload),
           std::move(reply));
  }
  void end() override { _journal.add("end"); }
  std::string description() const override { return "recording session"; }

 private:
  void answer(const std::string& line, StringReply reply) {
    _journal.add(line);
    if (reply) reply("done");
  }
  Journal& _journal;
};

struct Received {
  FrameKind kind;
  std::uint32_t callID;
  Dictionary body;
  std::string description() const {
    const Dictionary* error = body.dictionary("error");
    const std::string* text = error ? error->string("description") : nullptr;
    return text ? *text : "";
  }
  std::string results() const {
    const Value* found = body.find("results");
    return found ? textOf(*found) : "error: " + description();
  }
};

// A client at a bare socket.
class Client {
 public:
  explicit Client(platform::FileDescriptor socket) : _socket(std::move(socket)) {
    const timeval patience{20, 0};
    ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  }
  static Client at(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    platform::FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(::connect(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0)
        << path << ": " << std::strerror(errno);
    return Client(std::move(socket));
  }

  int socket() const { return _socket.get(); }
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
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
        std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size() * sizeof(int));
      }
      const ssize_t count = ::sendmsg(_socket.get(), &message, MSG_NOSIGNAL);
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }
  bool call(std::uint32_t id, const char* op, Dictionary arguments = {}, FrameKind kind = FrameKind::call) {
    return send(callFrame(id, op, std::move(arguments), kind));
  }
  static std::string callFrame(std::uint32_t id, const char* op, Dictionary arguments = {},
                               FrameKind kind = FrameKind::call, std::uint8_t descriptors = 0) {
    Dictionary body{{"op", op}};
    body.set("args", std::move(arguments));
    return ipc::makeFrame(kind, id, std::move(body), descriptors);
  }
  static std::string helloFrame(Value wire = 1) {
    Dictionary body{{"library", "8.0"}};
    body.set("wire", std::move(wire));
    return ipc::makeFrame(FrameKind::hello, 0, std::move(body));
  }
  void greet() {
    send(helloFrame());
    const auto answer = receive();
    ASSERT_TRUE(answer && answer->kind == FrameKind::hello);
    EXPECT_EQ(textOf(Value(answer->body)), "{daemon=8.0 wire=1}");
  }

  // Nothing: the end, or no frame in time.
  std::optional<Received> receive() {
    ipc::Frame frame;
    while (_reader.next(frame) == ipc::FrameReader::Next::needMore) {
      const auto [place, size] = _reader.room();
      const ssize_t count = ::recv(_socket.get(), place, size, 0);
      if (count <= 0) {
        _ended = count == 0 || errno == ECONNRESET;
        return std::nullopt;
      }
      _reader.received(static_cast<std::size_t>(count));
    }
    auto parsed = parseBinaryPropertyList(frame.body);
    if (!parsed || !parsed.value().asDictionary()) return std::nullopt;
    return Received{frame.header.kind, frame.header.callID, *parsed.value().asDictionary()};
  }
  // The daemon has closed, and nothing more was to be read.
  bool atEnd() { return !receive() && _ended; }
  // Until the daemon has read everything that was sent.
  void waitUntilRead() {
    const auto deadline = soon();
    int unread = 1;
    while (::ioctl(_socket.get(), SIOCOUTQ, &unread) == 0 && unread > 0) {
      ASSERT_LT(std::chrono::steady_clock::now(), deadline);
      std::this_thread::yield();
    }
  }
  void stopWriting() { ::shutdown(_socket.get(), SHUT_WR); }
  void close() { _socket.reset(); }

 private:
  platform::FileDescriptor _socket;
  ipc::FrameReader _reader;
  bool _ended = false;
};

// A door in a directory of its own. The delegate asks for the entitlement as the daemon does.
class Door : public ListenerDelegate {
 public:
  explicit Door(bool granted = true, std::size_t most = 4096, std::size_t mostOfOneUser = 1024,
                std::size_t readBudget = ipc::kReadBudget)
      : root(makeDirectory()), _entitlements(_files, "entitlements.plist") {
    const Dictionary rule{{"uid", static_cast<unsigned>(::getuid())},
                          {"entitlements", Dictionary{{kVeltraEntitlement, granted}}}};
    _files.put("entitlements.plist", writeBinaryPropertyList(Value(Array{Value(rule)})));
    auto socket = ipc::openServiceSocket(root, std::nullopt);
    EXPECT_TRUE(socket.ok()) << (socket.ok() ? "" : socket.error());
    _listener = std::make_unique<Listener>(
        ipc::ListenerOptions{std::move(socket.value()), _entitlements, counters, root.entitlementsPath(),
                             most, mostOfOneUser, readBudget},
        *this);
    EXPECT_TRUE(_listener->resume());
  }
  ~Door() override {
    _listener.reset();
    std::filesystem::remove_all(root.directory());
  }

  bool listener(Listener&, const std::shared_ptr<Connection>& connection) override {
    const auto granted = connection->valueForEntitlement(kVeltraEntitlement);
    if (!granted || !granted->isBoolean() || !*granted->toBoolean()) return false;
    auto session = std::make_shared<RecordingSession>(journal);
    session->onMessage = onMessage;
    connection->setExportedObject(session);
    connection->setInterruptionHandler([this] { journal.add("interrupted"); });
    connection->setInvalidationHandler([this] { journal.add("invalidated"); });
    {
      std::lock_guard lock(_mutex);
      _connections.push_back(connection);
    }
    connection->resume();
    return true;
  }

  Client client() { return Client::at(root.socketPath()); }
  std::size_t stop() { return _listener->invalidate(soon()); }
  std::size_t stop(std::chrono::milliseconds within) {
    return _listener->invalidate(std::chrono::steady_clock::now() + within);
  }
  // The client's object of the connection accepted as number `index`, once its hello was answered.
  std::shared_ptr<ClientSessionReplyInterface> remote(std::size_t index,
                                                      std::function<void(const std::string&)> failed) {
    std::lock_guard lock(_mutex);
    const auto connection = _connections.at(index).lock();
    return connection ? connection->remoteObjectProxyWithErrorHandler(std::move(failed)) : nullptr;
  }

  const platform::Root root;
  fakes::RecordedLog log;
  platform::Counters counters;
  Journal journal;
  // Given to each session made afterwards.
  std::function<void(std::uint16_t category, StringReply)> onMessage;

 private:
  static std::string makeDirectory() {
    char name[] = "/tmp/veltra-ipc-XXXXXX";
    EXPECT_NE(::mkdtemp(name), nullptr);
    std::filesystem::create_directories(std::string(name) + "/run/veltrad");
    return name;
  }

  fakes::FakeFileStore _files;
  platform::Entitlements _entitlements;
  std::mutex _mutex;
  std::vector<std::weak_ptr<Connection>> _connections;
  std::unique_ptr<Listener> _listener;
};

inline Dictionary message(int category, int type) {
  return {{"category", category}, {"type", type}, {"payload", Dictionary{{"codec", "opus"}}}};
}
inline constexpr const char* kSend = "sendMessageWithCategory:type:payload:reply:";

}  // namespace veltrad::ipc_test
