// SPDX-License-Identifier: Apache-2.0
// One client's connection over a Unix socket.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

#include "ipc/connection.h"
#include "ipc/entitlements.h"
#include "ipc/observer.h"
#include "ipc/out_queue.h"
#include "ipc/peer.h"
#include "ipc/socket_reader.h"
#include "platform/counters.h"
#include "platform/lent_files.h"

namespace veltrad::ipc {

// Reads frames, runs the calls in them one at a time on the exported session, and ends the session when the
// client has gone. The connection's own thread runs run(), and in it every call and handler; any thread may
// call stop(), nudge() and sendEvent(). Entitlements, lent files and counters must outlive it. A session and
// its connection hold each other until run() returns.
//
// Its 20 fields are the services that a call needs, the delegate's settings, and the state of the
// conversation.
class SocketConnection final : public Connection, public std::enable_shared_from_this<SocketConnection> {
 public:
  SocketConnection(std::uint64_t number, FileDescriptor socket, Peer peer, Entitlements& entitlements,
                   platform::LentFiles& lentFiles, platform::Counters& counters,
                   std::shared_ptr<platform::MemoryAccount> account);

  // False if there was no wake-up descriptor.
  bool usable() const { return _out->usable(); }
  const Peer& peer() const { return _peer; }

  // To be called once after the delegate has returned true: serves the client until the connection ends, then
  // calls the invalidation handler and the session's end(), and closes the socket.
  void run();
  // Tells the client why and closes the socket.
  void refuse(const std::string& description) override;
  // Reads nothing more. Frames that have arrived completely are run until `deadline`; then the client gets
  // the event "goodbye", and the connection ends.
  void stop(std::chrono::steady_clock::time_point deadline);

  // "connection 12 (uid 0, pid 345)"
  static std::string describe(std::uint64_t number, const Peer& peer);
  std::string description() const override { return _description; }
  std::shared_ptr<platform::MemoryAccount> memoryAccount() const override { return _account; }
  std::optional<Value> valueForEntitlement(std::string_view name) override;
  unsigned uid() const override { return _peer.uid; }
  void setExportedObject(std::shared_ptr<wire::ClientSessionInterface> session) override {
    _session = std::move(session);
  }
  void setObserver(std::shared_ptr<Observer> observer) override { _observer = std::move(observer); }
  void setInterruptionHandler(std::function<void()> handler) override {
    _interruptionHandler = std::move(handler);
  }
  void setInvalidationHandler(std::function<void()> handler) override {
    _invalidationHandler = std::move(handler);
  }
  void resume() override { _resumed = true; }
  void nudge() override;
  std::optional<std::string> sendEvent(std::string_view frame) override;

 private:
  void serve();
  bool runFrames();
  bool runFrame(const wire::Frame& frame);
  std::optional<std::string> runCall(const wire::Frame& frame, FileDescriptor lent);
  std::optional<std::string> dispatch(const wire::Frame& frame, const std::string& extensionToken = {});
  bool greet(const wire::Frame& frame);
  bool receive();
  void takeNews();
  bool waitForRoom();
  void waitForClientToRead();
  void waitForBytes();
  void poll(short events, int milliseconds = -1);
  void interrupted(const std::string& why);
  bool violation(const std::string& description);
  bool endWith(wire::Reason counted, const std::string& description);
  void end();
  void writeRest();
  bool overdue() const;

  // Constant after construction.
  const std::shared_ptr<OutQueue> _out;
  const Peer _peer;
  const std::string _description;
  const std::shared_ptr<platform::MemoryAccount> _account;
  Entitlements& _entitlements;
  platform::LentFiles& _lentFiles;
  platform::Counters& _counters;

  // Used only by the connection's own thread.
  SocketReader _reader;
  std::shared_ptr<wire::ClientSessionInterface> _session;
  std::shared_ptr<Observer> _observer;  // instead of a session
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;
  bool _resumed = false;
  bool _greeted = false;
  // Calls that were run, or ended with an error because they could not be.
  std::uint64_t _calls = 0;
  // The client sends nothing more.
  bool _ended = false;
  std::optional<std::chrono::steady_clock::time_point> _lackingRoomSince;

  std::atomic<bool> _nudged{false};
  std::atomic<bool> _stopping{false};
  std::atomic<std::chrono::steady_clock::rep> _deadline{
      std::chrono::steady_clock::time_point::max().time_since_epoch().count()};
};

// A refusal's frame, also for sockets that get no connection.
std::string refusalFrame(const std::string& description);

}  // namespace veltrad::ipc
