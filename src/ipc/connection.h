// SPDX-License-Identifier: Apache-2.0
// The interfaces of a client's connection and of the listener's delegate.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "wire/client_session_interface.h"

namespace veltrad::platform {
class MemoryAccount;
}  // namespace veltrad::platform

namespace veltrad::ipc {

class Listener;
class Observer;

// The delegate sets it up in its listener() call and then calls resume(). After that the connection's own
// thread reads frames and runs calls and handlers, one at a time. Any thread may call sendEvent() and
// nudge().
class Connection {
 public:
  virtual ~Connection() = default;

  virtual std::string description() const = 0;
  // The account to which data kept for this client is charged; may be null.
  virtual std::shared_ptr<platform::MemoryAccount> memoryAccount() const = 0;
  virtual std::optional<Value> valueForEntitlement(std::string_view name) = 0;
  virtual unsigned uid() const = 0;
  virtual void setExportedObject(std::shared_ptr<wire::ClientSessionInterface> session) = 0;
  // Instead of a session: of a connection to the control socket.
  virtual void setObserver(std::shared_ptr<Observer> observer) = 0;
  // A frame of whole length that held no readable call; the connection goes on.
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;
  // Called once, when the connection has ended, before the session's end().
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  virtual void resume() = 0;
  // Instead of resume(), in a delegate's call that returns true: tells the client why and ends the
  // connection.
  virtual void refuse(const std::string& description) = 0;

  // Makes the connection's own thread call the session's takeNews() soon, between two calls. Takes only leaf
  // locks.
  virtual void nudge() {}
  // Sends a frame of client_events.h. Never blocks, and takes only leaf locks. Returns why the frame was
  // dropped, if it was.
  virtual std::optional<std::string> sendEvent(std::string_view frame) = 0;
};

class ListenerDelegate {
 public:
  virtual ~ListenerDelegate() = default;
  // True if the connection was accepted and resumed, false if it was refused and is not kept. Runs on the new
  // connection's thread.
  virtual bool listener(Listener& listener, const std::shared_ptr<Connection>& shouldAcceptNewConnection) = 0;
};

}  // namespace veltrad::ipc
