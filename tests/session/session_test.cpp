// SPDX-License-Identifier: Apache-2.0
// How a session handles a new decision of the owner and a new storebag, also after its end or when memory is
// short.
#include <gtest/gtest.h>

#include <new>
#include <utility>
#include <vector>

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
  void refuse(const std::string&) override {}
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
  std::optional<session::StorebagNow> storebagNow(const session::VeltradSession&) override {
    return session::StorebagNow{now, "off"};
  }
  void sessionInfoUpdated(session::FamilyFacts) override {}
  void userInfoUpdatedForSession(session::FamilyFacts) override {
    ++joined;
    if (std::exchange(lacksMemory, false)) throw std::bad_alloc();
  }
  void updateDownstreamSessions(session::FamilyFacts) override {}
  bool ancestorAggregates(const session::FamilyPlace&) override { return false; }
  session::CopySent sendToAncestor(const session::FamilyPlace&, std::string_view) override { return {}; }
  std::string description() const override { return "daemon"; }
  int joined = 0;
  bool lacksMemory = false;
  std::shared_ptr<const config::StorebagSection> now;
};

class Session : public testing::Test {
 protected:
  Session() {
    gate.refresh();
    session->setSessionInfo(Dictionary{{"clientType", 7}, {"requireUserInfo", true}},
                            Dictionary{{"clientName", "phone"}}, {}, false);
    session->startConfigWithCompletionHandler(nullptr);
  }
  void setPolicy(const char* policy) {
    world.files.put("/policy.json", policy);
    ASSERT_TRUE(gate.refresh());
  }
  std::vector<std::string> reporting() {
    std::optional<std::vector<std::string>> names;
    session->fetchStatesWithUserInfo(std::nullopt, [&](auto answer) { names = std::move(answer); });
    return names.value_or(std::vector<std::string>{"no storebag"});
  }

  RecordedLog log;
  World world;
  config::OwnerPolicy policy{world.files, "/policy.json"};
  platform::DeviceSecret secret{world.files, "/secret"};
  config::DailyAllowance day{world.files, world.clock, "/daily"};
  config::OwnerGate gate{policy, world.preferences, secret, day};
  platform::DiskWriter writer;
  support::MessageLog messages{world.clock, "/nowhere", writer, world.counters};
  session::FlushCounters flushes;
  Daemon daemon;
  const std::shared_ptr<session::VeltradSession> session = session::VeltradSession::initWithSessionDelegate(
      {world.factory, world.device, world.library, world.clock, world.preferences, world.locale,
       world.counters, flushes, messages, gate},
      daemon, std::make_shared<Client>());
};

TEST_F(Session, DoesNotComeBackIntoItsFamilyWhenThePolicyHasChangedAfterItsEnd) {
  const int joined = daemon.joined;
  setPolicy(R"({"backends": ["httppost"]})");
  session->end();
  EXPECT_EQ(daemon.joined, joined);
}

TEST_F(Session, HearsTheOwnersWordAgainIfItHadNoMemoryToObey) {
  EXPECT_EQ(reporting(), std::vector<std::string>{"ampery"});
  setPolicy(R"({"backends": ["httppost"]})");
  daemon.lacksMemory = true;
  EXPECT_THROW(reporting(), std::bad_alloc);
  EXPECT_EQ(reporting(), std::vector<std::string>());
}

TEST_F(Session, FollowsItsStorebagLaterIfItHadNoMemoryForTheNewBackEnds) {
  daemon.now = config::parseSection({});
  world.properties.lackMemory();
  EXPECT_THROW(session->takeNews(), std::bad_alloc);
  EXPECT_EQ(reporting(), std::vector<std::string>{"ampery"});
  session->takeNews();
  EXPECT_EQ(reporting(), std::vector<std::string>());
}

}  // namespace
}  // namespace veltrad
