// A connection without a socket: the test asks and ends it. The test's thread.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "protocol/connection.h"

namespace veltrad {

class FakeConnection final : public Connection {
 public:
  struct Copy {
    OptionalDictionary sessionInfo;
    double timestamp;
    std::uint16_t category, type;
    OptionalDictionary payload;
  };

  std::string description() const override { return "connection under test"; }
  std::optional<Value> valueForEntitlement(std::string_view) override { return entitlement; }
  void setExportedObject(std::shared_ptr<ClientSessionInterface> object) override {
    session = std::move(object);
  }
  void setInterruptionHandler(std::function<void()> handler) override { interruption = std::move(handler); }
  void setInvalidationHandler(std::function<void()> handler) override { _invalidation = std::move(handler); }
  void resume() override { resumed = true; }
  std::shared_ptr<ClientSessionReplyInterface> remoteObjectProxyWithErrorHandler(
      std::function<void(const std::string&)> handler) override {
    struct Proxy final : ClientSessionReplyInterface {
      Proxy(FakeConnection& owner, std::function<void(const std::string&)> onError)
          : connection(owner), error(std::move(onError)) {}
      void sendMessageToClient(OptionalDictionary sessionInfo, double timestamp, std::uint16_t category,
                               std::uint16_t type, OptionalDictionary payload) override {
        if (connection.gone) return error("the client has gone");
        connection.copies.push_back({std::move(sessionInfo), timestamp, category, type, std::move(payload)});
      }
      FakeConnection& connection;
      std::function<void(const std::string&)> error;
    };
    return std::make_shared<Proxy>(*this, std::move(handler));
  }

  // As the connection's own thread does it at the end.
  void invalidate() {
    std::exchange(_invalidation, nullptr)();
    std::exchange(session, nullptr)->end();
  }

  std::optional<Value> entitlement = Value(true);
  std::shared_ptr<ClientSessionInterface> session;
  std::function<void()> interruption;
  std::vector<Copy> copies;
  bool resumed = false;
  bool gone = false;

 private:
  std::function<void()> _invalidation;
};

}  // namespace veltrad
