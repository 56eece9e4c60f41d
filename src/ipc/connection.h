// A client's connection and the listener's delegate, as the agent and the sessions see them.
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

// Set-up operations are for the delegate's listener() call, before resume(). After resume() the connection's
// own thread reads frames and runs calls and handlers, one at a time. sendEvent: any thread.
class Connection {
 public:
  virtual ~Connection() = default;

  virtual std::string description() const = 0;
  // Whom what is kept for this client is charged to; null: nobody.
  virtual std::shared_ptr<platform::MemoryAccount> memoryAccount() const = 0;
  virtual std::optional<Value> valueForEntitlement(std::string_view name) = 0;
  virtual unsigned uid() const = 0;
  virtual void setExportedObject(std::shared_ptr<wire::ClientSessionInterface> session) = 0;
  // Instead of a session: of a connection to the control socket.
  virtual void setObserver(std::shared_ptr<Observer> observer) = 0;
  // A frame of whole length that held no readable call; the connection goes on.
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;
  // Once, when the connection has ended; released afterwards. The session's end() follows it.
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  virtual void resume() = 0;

  // A frame of client_events.h. Never blocks, and takes a leaf lock alone. Why it was dropped (the client has
  // gone, or its queue is full), or nothing.
  virtual std::optional<std::string> sendEvent(std::string_view frame) = 0;
};

class ListenerDelegate {
 public:
  virtual ~ListenerDelegate() = default;
  // True: accepted and resumed. False: refused, and nothing was kept. Runs on the listener's thread, or on
  // the new connection's own.
  virtual bool listener(Listener& listener, const std::shared_ptr<Connection>& shouldAcceptNewConnection) = 0;
};

}  // namespace veltrad::ipc
