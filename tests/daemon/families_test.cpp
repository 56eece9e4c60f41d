// SPDX-License-Identifier: Apache-2.0
// Families: parents, combined IDs, states and copies of sessions that share an identity.
#include "daemon/families.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <functional>
#include <mutex>
#include <sstream>
#include <thread>
#include <vector>

#include "backends/backend.h"
#include "fakes/machine.h"
#include "fakes/recorded_log.h"
#include "ipc/connection.h"
#include "wire/constants.h"

namespace veltrad {
namespace {

struct Client final : ipc::Connection {
  std::string description() const override { return "client"; }
  std::shared_ptr<platform::MemoryAccount> memoryAccount() const override { return nullptr; }
  std::optional<Value> valueForEntitlement(std::string_view) override { return std::nullopt; }
  unsigned uid() const override { return 0; }
  void setExportedObject(std::shared_ptr<wire::ClientSessionInterface>) override {}
  void setObserver(std::shared_ptr<ipc::Observer>) override {}
  void setInterruptionHandler(std::function<void()>) override {}
  void setInvalidationHandler(std::function<void()>) override {}
  void resume() override {}
  void refuse(const std::string&) override {}
  std::optional<std::string> sendEvent(std::string_view frame) override {
    std::this_thread::yield();  // others come to wait meanwhile
    add(frame == "copy" ? "copy" : "end");
    return std::nullopt;
  }
  void add(std::string what) {
    const std::lock_guard held(mutex);
    came.push_back(std::move(what));
  }

  std::mutex mutex;
  std::vector<std::string> came;
};

struct Reporting final : backends::VeltraBackend {
  Reporting(const char* name, platform::Random& random) : VeltraBackend(name, "", random) {}
};

// "A0": ID A, level 0. Then, in any order: "@name" another client than "phone", "!" aggregates, "=1" its back
// end's own state (2), "-" lacks the back end that the others have.
struct Session {
  Session(const std::string& text, platform::Random& random) : id(text.substr(0, 1)) {
    std::istringstream rest(text.substr(1));
    int level = 0;
    rest >> level;
    std::string name = "phone";
    std::int32_t state = 2;
    bool lacks = false;
    for (char sign = 0; rest >> sign;) {
      if (sign == '@') std::getline(rest, name, ',');
      if (sign == '=') rest >> state;
      if (sign == '-') lacks = true;
      if (sign == '!') aggregation->setActive(true);
    }
    // The first back end gives the level; the state of the second one is checked.
    const auto leading = std::make_shared<Reporting>("leading", random);
    leading->setHierarchy(level);
    set->emplace(wire::kVeltraBackendHTTPPost, leading);
    if (!lacks) {
      backend = std::make_shared<Reporting>(wire::kVeltraBackendDashboard, random);
      backend->setState({state, wire::Reason::reports});
      backend->setSamplingThreshold(id[0]);
      backends::SessionFacts facts;
      facts.combinedSessionIDString = id;
      backend->setFacts(std::make_shared<const backends::SessionFacts>(std::move(facts)));
      set->emplace(wire::kVeltraBackendDashboard, backend);
    }
    identify(name);
  }
  void identify(const std::string& name) {
    userInfo = std::make_shared<const Dictionary>(
        Dictionary{{wire::kVeltraUserInfoClientName, name}, {wire::kVeltraUserInfoServiceName, "ringer"}});
  }
  session::FamilyFacts facts() const {
    return {aggregation, static_cast<std::uint32_t>(id[0]), id, userInfo, set, nullptr, userInfo};
  }
  session::FamilyPlace place() const { return {*aggregation, userInfo, session::hierarchyOf(set.get())}; }
  // Combined ID, state, whose threshold, "!" while it aggregates.
  std::string look() const {
    std::string text = id;
    if (backend) {
      text = *backend->facts()->combinedSessionIDString + "=" + std::to_string(backend->state()) +
             static_cast<char>(*backend->samplingThreshold());
    }
    return text + (aggregation->active() ? "!" : "");
  }

  std::string id;
  std::shared_ptr<Client> client = std::make_shared<Client>();
  std::shared_ptr<session::Aggregation> aggregation = std::make_shared<session::Aggregation>(client);
  backends::SharedDictionary userInfo;
  std::shared_ptr<Reporting> backend;
  std::shared_ptr<session::BackendSet> set = std::make_shared<session::BackendSet>();
};

// Some sessions and the families they are in.
class World {
 public:
  Session& join(const std::string& text) {
    Session& session = *_sessions.emplace_back(std::make_unique<Session>(text, _random));
    refresh(session);
    return session;
  }
  void refresh(Session& session) {
    families.userInfoUpdatedForSession(session.facts());
    families.updateDownstreamSessions(session.facts());
  }
  std::string look() const {
    std::string all;
    for (const auto& session : _sessions) all += (all.empty() ? "" : " ") + session->look();
    return all;
  }
  // Returns the session whose client gets the copy.
  std::string copyOf(const Session& sender) {
    if (families.ancestorAggregates(sender.place()) !=
        families.sendToAncestor(sender.place(), "copy").taken) {
      return "a promise that was not kept";
    }
    std::string takers;
    for (const auto& session : _sessions) {
      const std::lock_guard held(session->client->mutex);
      if (std::erase(session->client->came, "copy") > 0) takers += session->id;
    }
    return takers;
  }

  daemon::Families families;

 private:
  FakeRandom _random;
  std::vector<std::unique_ptr<Session>> _sessions;
};

struct Case {
  const char* what;
  std::vector<std::string> joins;
  const char* seen;
  const char* taker = "";  // of a copy of the last one's message
};

TEST(Families, WhatAFamilyMakesOfItsSessions) {
  const RecordedLog log;
  for (const Case& c : std::vector<Case>{
           {"alone", {"A0"}, "A=2A"},
           {"a chain, downwards", {"A0", "B1", "C2"}, "A=2A A.B=2A A.B.C=2A"},
           {"a chain, upwards: the order of joining counts", {"C2", "B1", "A0"}, "A.B.C=2B A.B=2A A=2A"},
           {"no root", {"B1", "C2"}, "B=2B B.C=2B"},
           {"a gap next to it", {"A0", "C2"}, "A=2A C=2C"},
           {"a gap far up", {"A0", "C2", "D3"}, "A=2A C=2C C.D=2C"},
           {"equal numbers: the first", {"A0", "B0", "C1", "D1", "E2"}, "A=2A B=2B A.C=2A A.D=2A A.C.E=2A"},
           {"letter case", {"A0@Phone", "B1@pHONE"}, "A=2A A.B=2A"},
           {"two families", {"A0", "B1@tablet", "C0@tablet", "D1"}, "A=2A C.B=2C C=2C A.D=2A"},
           {"a disabled parent", {"A0=1", "B1", "C2"}, "A=1A A.B=1A A.B.C=1A"},
           {"a parent that waits", {"A0=0", "B1"}, "A=0A A.B=0A"},
           {"a held parent", {"A0=3", "B1"}, "A=3A A.B=3A"},
           {"a held child keeps its own", {"A0=1", "B1=3", "C2=2"}, "A=1A A.B=3B A.B.C=3B"},
           {"a parent that lacks the back end", {"A0-", "B1", "C2=3"}, "A A.B=1B A.B.C=3C"},
           {"the root aggregates", {"A0!", "B1!", "C2!"}, "A=2A! A.B=2A A.B.C=2A", "A"},
           {"the child alone", {"A0", "B1!", "C2!"}, "A=2A A.B=2A! A.B.C=2A", "B"},
           {"a late root", {"C2!", "B1!", "A0!"}, "A.B.C=2B A.B=2A A=2A!"},
           {"over a gap", {"A0!", "C2!"}, "A=2A! C=2C", "A"},
           {"the second of a level is nobody's ancestor", {"A0", "B0!", "C1!"}, "A=2A B=2B! A.C=2A!"},
           {"another family's root", {"A0!@tablet", "B1!"}, "A=2A! B=2B!"},
       }) {
    SCOPED_TRACE(c.what);
    World world;
    Session* last = nullptr;
    for (const std::string& text : c.joins) last = &world.join(text);
    EXPECT_EQ(world.look(), c.seen);
    EXPECT_EQ(world.copyOf(*last), c.taker);
  }
}

TEST(Families, ANegativeLevelHasNoParent) {
  RecordedLog log;
  World world;
  world.join("A0!");
  world.join("B-1!");
  EXPECT_EQ(world.look(), "A=2A B=2B!");  // but all others are below it
  EXPECT_EQ(log.count(RecordedLog::Level::info, "Unable to find session with hierarchy of -2"), 1);
}

TEST(Families, EmptiedListsStayWithinABound) {
  const RecordedLog log;
  World world;
  for (const std::string& name : {std::string(250, 'x'), std::string(249, 'x'), std::string(300, 'x')}) {
    world.families.leave(*world.join("A0@" + name).aggregation);
  }
  EXPECT_EQ(world.families.userInfoKeyCount(), 1u);  // "…:ringer" of 256 bytes, and not of 257 or more
  Session& session = world.join("A0");
  for (int number = 0; number < 5000; ++number) {
    session.identify(std::to_string(number));
    world.families.userInfoUpdatedForSession(session.facts());
  }
  EXPECT_EQ(world.families.userInfoKeyCount(), 4097u);  // the one that the session is in beside them
}

// Messages of a child and of the aggregating client's own session, while a root that aggregates ends the
// copies.
TEST(Families, NoCopyFollowsTheEnd) {
  const RecordedLog log;
  World world;
  Session& root = world.join("A0");
  Session& middle = world.join("B1");
  Session& child = world.join("C2");
  constexpr int kRounds = 200, kSent = 100;
  for (int round = 0; round < kRounds; ++round) {
    root.aggregation->setActive(false);
    middle.client->came.clear();
    middle.aggregation->setActive(true);
    std::atomic<int> sent{0};
    std::thread below([&] {
      for (int i = 0; i < kSent; ++i) sent += world.families.sendToAncestor(child.place(), "copy").taken;
    });
    std::thread own([&] {
      for (int i = 0; i < kSent; ++i) sent += middle.aggregation->sendToAggregator("copy", "B1").taken;
    });
    while (sent == 0) std::this_thread::yield();
    root.aggregation->setActive(true);
    world.families.updateDownstreamSessions(root.facts());
    below.join();
    own.join();
    const auto& came = middle.client->came;
    ASSERT_EQ(std::count(came.begin(), came.end(), "end"), 1);
    ASSERT_EQ(came.back(), "end");
  }
}

}  // namespace
}  // namespace veltrad
