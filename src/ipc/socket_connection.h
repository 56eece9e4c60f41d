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

// Job: reads frames, runs the calls in them one at a time on the exported session, and ends the session when
// the client has gone. One thread, the connection's own, runs run(), and in it every call and handler; stop()
// and sendEvent() may be called by any thread. Entitlements, lent files and
// counters outlive it. A session and its connection hold each other until run() returns.
//
// Its 18 fields are the services that a call may need, what the delegate has set, and how far the
// conversation has come.
class SocketConnection final : public Connection, public std::enable_shared_from_this<SocketConnection> {
 public:
  SocketConnection(std::uint64_t number, FileDescriptor socket, Peer peer, Entitlements& entitlements,
                   platform::LentFiles& lentFiles, platform::Counters& counters,
                   std::shared_ptr<platform::MemoryAccount> account);

  // False: the system had no wake-up descriptor for it.
  bool usable() const { return _out->usable(); }
  const Peer& peer() const { return _peer; }

  // The whole life after the delegate said yes: frames until the end, then the invalidation handler, the
  // session's end(), and the socket closed.
  void run();
  // The whole life after the delegate said no: the client is told why, and the socket closed.
  void refuse(const std::string& description);
  // The client's bytes end here: frames that came whole are run, up to `deadline`; then the connection ends.
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
  std::optional<std::string> sendEvent(std::string_view frame) override;

 private:
  void serve();
  bool runFrames();
  bool runFrame(const wire::Frame& frame);
  std::optional<std::string> runCall(const wire::Frame& frame, FileDescriptor lent);
  std::optional<std::string> dispatch(const wire::Frame& frame, const std::string& extensionToken = {});
  bool greet(const wire::Frame& frame);
  bool receive();
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

  // Own thread only.
  SocketReader _reader;
  std::shared_ptr<wire::ClientSessionInterface> _session;
  std::shared_ptr<Observer> _observer;  // instead of a session
  std::function<void()> _interruptionHandler;
  std::function<void()> _invalidationHandler;
  bool _resumed = false;
  bool _greeted = false;
  bool _ended = false;  // the client's bytes have ended
  std::optional<std::chrono::steady_clock::time_point> _lackingRoomSince;

  // Any thread.
  std::atomic<bool> _stopping{false};
  std::atomic<std::chrono::steady_clock::rep> _deadline{
      std::chrono::steady_clock::time_point::max().time_since_epoch().count()};
};

// A refusal's frame; for sockets that get no connection at all, too.
std::string refusalFrame(const std::string& description);

}  // namespace veltrad::ipc
