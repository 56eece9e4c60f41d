// SPDX-License-Identifier: Apache-2.0
// A session that has ended, and what the owner of the device says then.
#include <gtest/gtest.h>

#include "base/property_list.h"
#include "config/owner_gate.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "platform/device_secret.h"
#include "session/flush_counters.h"
#include "session/session_delegate.h"
#include "session/veltrad_session.h"

namespace veltrad {
namespace {

struct Client final : ipc::Connection {
  std::string description() const override { return "client"; }
  std::shared_ptr<platform::MemoryAccount> memoryAccount() const override { return nullptr; }
  std::optional<Value> valueForEntitlement(std::string_view) override { return true; }
  unsigned uid() const override { return 0; }
  void setExportedObject(std::shared_ptr<wire::ClientSessionInterface>) override {}
  void setObserver(std::shared_ptr<ipc::Observer>) override {}
  void setInterruptionHandler(std::function<void()>) override {}
  void setInvalidationHandler(std::function<void()>) override {}
  void resume() override {}
  std::optional<std::string> sendEvent(std::string_view) override { return std::nullopt; }
};

// Counts how often it is told to put the session into its family.
struct Daemon final : session::VeltradSessionDelegate {
  std::shared_ptr<const config::StorebagSection> storebagForSession(const session::VeltradSession&) override {
    return config::parseSection({{"ampery", Dictionary()}});
  }
  std::optional<std::string> storebagVersionForSession(const session::VeltradSession&) override {
    return std::nullopt;
  }
  void sessionInfoUpdated(session::FamilyFacts) override {}
  void userInfoUpdatedForSession(session::FamilyFacts) override { ++joined; }
  void updateDownstreamSessions(session::FamilyFacts) override {}
  bool ancestorAggregates(const session::FamilyPlace&) override { return false; }
  session::CopySent sendToAncestor(const session::FamilyPlace&, std::string_view) override { return {}; }
  std::string description() const override { return "daemon"; }
  int joined = 0;
};

TEST(EndedSession, DoesNotComeBackIntoItsFamilyWhenThePolicyHasChanged) {
  const RecordedLog log;
  World world;
  config::OwnerPolicy policy(world.files, "/policy.json");
  platform::DeviceSecret secret(world.files, "/secret");
  config::DailyAllowance day(world.files, world.clock, "/daily");
  config::OwnerGate gate(policy, world.preferences, secret, day);
  gate.refresh();
  platform::DiskWriter writer;
  support::MessageLog messages(world.clock, "/nowhere", writer, world.counters);
  session::FlushCounters flushes;
  Daemon daemon;
  const auto session = session::VeltradSession::initWithSessionDelegate(
      {world.factory, world.device, world.library, world.clock, world.preferences, world.locale,
       world.counters, flushes, messages, gate},
      daemon, std::make_shared<Client>());
  session->setSessionInfo(Dictionary{{"clientType", 7}, {"requireUserInfo", true}},
                          Dictionary{{"clientName", "phone"}}, {}, false);
  session->startConfigWithCompletionHandler(nullptr);
  const int joined = daemon.joined;
  world.files.put("/policy.json", R"({"backends": ["httppost"]})");
  ASSERT_TRUE(gate.refresh());
  session->end();
  EXPECT_EQ(daemon.joined, joined);
}

}  // namespace
}  // namespace veltrad
