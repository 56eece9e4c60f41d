// SPDX-License-Identifier: Apache-2.0
// A daemon's listener with recording sessions, and clients on bare sockets.
#pragma once

#include <gmock/gmock.h>

#include <atomic>
#include <new>

#include "base/property_list.h"
#include "fakes/answering_session.h"
#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "fakes/wire.h"
#include "ipc/listener.h"
#include "wire/constants.h"

namespace veltrad::ipc_test {

using namespace std::chrono_literals;
using ::testing::HasSubstr;

inline std::chrono::steady_clock::time_point within(std::chrono::milliseconds time) {
  return std::chrono::steady_clock::now() + time;
}

// Writes what comes into the journal; answers a message or leaves that to the test.
class RecordingSession final : public AnsweringSession {
 public:
  using OnMessage = std::function<void(std::uint16_t category, wire::SentReply)>;
  RecordingSession(Journal& journal, OnMessage onMessage)
      : _journal(journal), _onMessage(std::move(onMessage)) {}

  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, wire::OptionalDictionary payload,
                               wire::SentReply reply) override {
    _journal.add("sendMessage " + std::to_string(category) + " " + std::to_string(type) + " " +
                 (payload ? formats::writeJSON(*payload) : "none"));
    _onMessage ? _onMessage(category, std::move(reply)) : reply("done", {});
  }
  void end() override { _journal.add("end"); }

 private:
  Journal& _journal;
  const OnMessage _onMessage;
};

inline std::string callFrame(std::uint32_t id, const char* op, Dictionary arguments = {},
                             wire::FrameKind kind = wire::FrameKind::call, std::uint8_t descriptors = 0) {
  return wire::makeFrame(kind, id, Dictionary{{"op", op}, {"args", std::move(arguments)}}, descriptors);
}
inline std::string messageFrame(std::uint32_t id, int category = 1, int type = 1) {
  return callFrame(id, operation::kSendMessage, {{"category", category}, {"type", type}});
}
inline std::string helloFrame(Value wire = 1) {
  return wire::makeFrame(wire::FrameKind::hello, 0,
                         Dictionary{{"library", "8.0"}, {"wire", std::move(wire)}});
}

// A listener in a temporary directory that accepts every client.
class Door : public ipc::ListenerDelegate {
 public:
  explicit Door(std::size_t most = 4096, std::size_t mostOfOneUser = 1024, platform::MemoryBounds bounds = {})
      : memory(bounds) {
    const Dictionary rule{{"uid", ::getuid()},
                          {"entitlements", Dictionary{{wire::kVeltraEntitlement, true}}}};
    _files.put("entitlements.plist", writeBinaryPropertyList(Array{rule}));
    auto socket = ipc::openServiceSocket(root, std::nullopt);
    EXPECT_TRUE(socket.ok()) << (socket.ok() ? "" : socket.error());
    _listener = std::make_unique<ipc::Listener>(
        ipc::ListenerOptions{std::move(socket.value()), _entitlements, lentFiles, counters, memory,
                             root.entitlementsPath(), most, mostOfOneUser},
        *this);
    EXPECT_TRUE(_listener->resume());
  }

  bool listener(ipc::Listener&, const std::shared_ptr<ipc::Connection>& connection) override {
    if (refusesMemory.exchange(false)) throw std::bad_alloc();
    connection->setExportedObject(std::make_shared<RecordingSession>(journal, onMessage));
    connection->setInterruptionHandler([this] { journal.add("interrupted"); });
    connection->setInvalidationHandler([this] { journal.add("invalidated"); });
    connection->resume();
    return true;
  }

  WireEnd stranger() { return WireEnd(unixSocket(::connect, root.socketPath())); }
  // A client that has exchanged hellos.
  WireEnd client() {
    WireEnd client = stranger();
    client.send(helloFrame());
    EXPECT_EQ(formats::writeJSON(client.next().body), R"({"daemon":"8.0","wire":1})");
    return client;
  }
  std::size_t stop(std::chrono::milliseconds time = kPatience) { return _listener->invalidate(within(time)); }

  const TemporaryRoot root;
  RecordedLog log;
  platform::Counters counters;
  platform::MemoryBudget memory;
  Journal journal;
  std::atomic<bool> refusesMemory{false};  // to the next connection
  RecordingSession::OnMessage onMessage;   // given to each session made afterwards

 private:
  FakeFileStore _files;
  ipc::Entitlements _entitlements{_files, "entitlements.plist"};
  platform::LentFiles lentFiles;
  std::unique_ptr<ipc::Listener> _listener;
};

}  // namespace veltrad::ipc_test
