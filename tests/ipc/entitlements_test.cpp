// SPDX-License-Identifier: Apache-2.0
// The identity of a peer, and the entitlements that the rules grant it.
#include "ipc/entitlements.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "fakes/scarce_memory.h"
#include "fakes/unix_socket.h"
#include "formats/property_list.h"
#include "ipc/peer.h"
#include "platform/child_process.h"

namespace veltrad::platform {
namespace {

constexpr const char* kName = "com.florn.private.veltrad";
constexpr const char* kPath = "/etc/veltrad/entitlements.plist";

Dictionary rule(Dictionary conditions, Value granted = true) {
  conditions.set("entitlements", Dictionary{{kName, granted}});
  return conditions;
}

TEST(EntitlementRules, MatchWhatTheKernelSaidOfThePeer) {
  const ipc::Peer peer{1'000, {100, 27, 4}, 42, "agent.service"};
  const ipc::Peer unitless{1'000, {100}, 42, {}};
  const Dictionary other{{"uid", 1'000}, {"entitlements", Dictionary{{"x", true}}}};
  const struct {
    const char* what;
    Array rules;
    bool peerGets, unitlessGets;
  } cases[] = {
      {"no rules", {}, false, false},
      {"uid", {rule({{"uid", 1'000}})}, true, true},
      {"another uid", {rule({{"uid", 1'001}})}, false, false},
      {"effective gid", {rule({{"gid", 100}})}, true, true},
      {"supplementary gid", {rule({{"gid", 4u}})}, true, false},
      {"unit", {rule({{"unit", "agent.service"}})}, true, false},
      {"another unit", {rule({{"unit", "agent"}})}, false, false},
      {"an empty unit", {rule({{"unit", ""}})}, false, false},
      {"all of three", {rule({{"uid", 1'000}, {"gid", 27}, {"unit", "agent.service"}})}, true, false},
      {"all but one", {rule({{"uid", 1'000}, {"gid", 28}})}, false, false},
      {"no condition", {rule({})}, false, false},
      {"the second rule", {rule({{"uid", 0}}), rule({{"uid", 1'000}})}, true, true},
      {"a uid that is a text", {rule({{"uid", "1000"}})}, false, false},
      {"a uid that is a real", {rule({{"uid", 1'000.0}})}, false, false},
      {"a uid of the wrong type is not absent", {rule({{"uid", "0"}, {"gid", 100}})}, false, false},
      {"a unit of the wrong type is not absent", {rule({{"uid", 1'000}, {"unit", 1}})}, false, false},
      {"a uid that would have to wrap", {rule({{"uid", (1LL << 32) + 1'000}})}, false, false},
      {"no dictionary", {"uid", rule({{"uid", 1'000}})}, true, true},
      {"another name", {other}, false, false},
      {"another name first", {other, rule({{"gid", 100}})}, true, true}};
  for (const auto& c : cases) {
    EXPECT_EQ(ipc::entitlementInRules(c.rules, kName, peer).has_value(), c.peerGets) << c.what;
    EXPECT_EQ(ipc::entitlementInRules(c.rules, kName, unitless).has_value(), c.unitlessGets) << c.what;
  }
  // The first rule that names it decides; an overflowed id is nobody's.
  const Array rules{rule({{"uid", 1'000}}, false), rule({{"gid", 100}}, true)};
  EXPECT_EQ(ipc::entitlementInRules(rules, kName, peer), Value(false));
  EXPECT_FALSE(
      ipc::entitlementInRules({rule({{"uid", -1}})}, kName, ipc::Peer{0xffff'ffff, {0xffff'ffff}, 0, {}}));
}

class EntitlementsTest : public ::testing::Test {
 protected:
  std::optional<Value> granted() {
    return _entitlements.valueForEntitlement(kName, ipc::Peer{1'000, {100}, 42, {}});
  }
  void put(const Array& rules) { _files.put(kPath, formats::writeXMLPropertyList(rules)); }

  RecordedLog _log;
  FakeFileStore _files;
  ipc::Entitlements _entitlements{_files, kPath};
};

TEST_F(EntitlementsTest, AFileThatCannotBeReadGrantsNothingAndIsOneLineAChange) {
  EXPECT_FALSE(granted());  // no file: no line
  put({rule({{"uid", 1'000}})});
  EXPECT_TRUE(granted());
  for (const std::string& bytes :
       {std::string("rubbish"), formats::writeXMLPropertyList(rule({{"uid", 1'000}}))}) {
    _files.put(kPath, bytes);
    _log.expectLine(platform::LogLevel::error,
                    "Entitlements could not be read, nothing is granted: " + std::string(kPath));
    for (int i = 0; i < 2; ++i) EXPECT_FALSE(granted());
  }
  put({rule({{"uid", 1'000}})});
  EXPECT_TRUE(granted());
  put({rule({{"uid", 0}})});
  EXPECT_FALSE(granted());
  _files.remove(kPath);
  EXPECT_FALSE(granted());
  put({rule({{"uid", 1'000}})});
  _files.failReads(kPath, platform::FileFailure::Kind::noAccess);
  _log.expectLine(platform::LogLevel::error, "Permission denied");
  for (int i = 0; i < 2; ++i) EXPECT_FALSE(granted());
}

TEST_F(EntitlementsTest, ARuleOfAWrongTypeIsAWarningThatNamesItAndTheOthersHold) {
  const char* const kGood = R"({"uid": 1000, "entitlements": {"com.florn.private.veltrad": true}})";
  const std::pair<const char*, const char*> table[] = {
      {"5", "expected a dictionary"},
      {R"({"entitlements": {}})", "expected \"uid\", \"gid\" or \"unit\""},
      {R"({"uid": "root", "entitlements": {}})", "\"uid\" is no user id, expected an integer"},
      {R"({"gid": 1.5, "entitlements": {}})", "\"gid\" is no group id, expected an integer"},
      {R"({"uid": 0, "unit": 7, "entitlements": {}})", "\"unit\" is no text, expected a unit's name"},
      {R"({"uid": 0, "entitlements": ["x"]})", "expected a dictionary under \"entitlements\""}};
  const std::string json = "/etc/veltrad/entitlements.json";
  for (const auto& [rule, problem] : table) {
    _files.put(json, std::string("[\n  // who may report\n  ") + kGood + ",\n  " + rule + "\n]");
    _log.expectLine(platform::LogLevel::warning,
                    "Entitlements: " + json + ":4:3: rule 1 grants nothing: " + problem);
    for (int i = 0; i < 2; ++i) EXPECT_TRUE(granted()) << rule;
  }
  _files.put(json, "[");
  _log.expectLine(platform::LogLevel::error,
                  "Entitlements could not be read, nothing is granted: " + json + ":1:2: ");
  EXPECT_FALSE(granted());
  _entitlements.readAgain();
}

TEST_F(EntitlementsTest, TheLastRulesStandDuringAShortage) {
  put({rule({{"uid", 1'000}})});
  _log.expectLine(platform::LogLevel::warning,
                  "Entitlements could not be read just now, the last rules stand: ");
  _files.runShort(true);
  EXPECT_FALSE(granted());  // never read
  _files.runShort(false);
  EXPECT_TRUE(granted());
  put({rule({{"uid", 0}})});
  for (const bool stampsFail : {false, true}) {
    _files.runShort(true, stampsFail);
    EXPECT_TRUE(granted());
  }
  _files.runShort(false);
  EXPECT_FALSE(granted());
}

TEST(Entitlements, AreReadAgainForWantOfMemory) {
  const ipc::Peer peer{1'000, {100}, 42, {}};
  const std::string mine = formats::writeXMLPropertyList(Array{rule({{"uid", 1'000}})});
  const std::string anothers = formats::writeXMLPropertyList(Array{rule({{"uid", 1}}), rule({{"uid", 2}})});
  forEachShortage([&](const auto& shortOfMemory) {
    FakeFileStore files;
    ipc::Entitlements entitlements(files, kPath);
    files.put(kPath, mine);
    shortOfMemory([&] { EXPECT_TRUE(entitlements.valueForEntitlement(kName, peer)); });
    EXPECT_TRUE(entitlements.valueForEntitlement(kName, peer));
    files.put(kPath, anothers);
    shortOfMemory([&] { static_cast<void>(entitlements.valueForEntitlement(kName, peer)); });
    EXPECT_FALSE(entitlements.valueForEntitlement(kName, peer));
  });
}

TEST(SystemUnit, IsTheFirstBelowTheSlicesAndNeverAUsers) {
  for (const std::string row :
       {"/system.slice/x.service x.service", "/system.slice/system-foo.slice/foo@1.service foo@1.service",
        "/system.slice/x.service/system.slice/root.service x.service", "/x.service x.service",
        "/machine.slice/m.scope/payload m.scope"})
    EXPECT_EQ(ipc::systemUnitOfControlGroup(row.substr(0, row.find(' '))), row.substr(row.find(' ') + 1));
  for (const char* path :
       {"/user.slice/user-1000.slice/user@1000.service/app.slice/x.service",
        "/user.slice/user-1000.slice/session-2.scope", "/user.slice", "/system.slice", "/docker/x.service",
        "/system.slice/sub/x.service", "/../x.service", "/system.slice/x.service (deleted)",
        "/system.slice/.service", "system.slice/x.service", "/system.slice//x.service", "/", ""})
    EXPECT_FALSE(ipc::systemUnitOfControlGroup(path)) << path;
}

TEST(PeerOfSocket, SaysWhoConnectedAndGivesTheDeadNoUnit) {
  const TemporaryDirectory directory;
  const FileDescriptor listening = unixSocket(::bind, directory.path("s"));
  ASSERT_EQ(::listen(listening.get(), 1), 0);
  const ChildProcess child([&](const auto&) { unixSocket(::connect, directory.path("s")); });
  const FileDescriptor accepted(::accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
  const auto peer = ipc::peerOfSocket(accepted.get());
  ASSERT_TRUE(peer);
  EXPECT_EQ(peer.value().uid, ::geteuid());
  EXPECT_EQ(peer.value().pid, child.pid);
  EXPECT_FALSE(peer.value().unit);
  std::vector<gid_t> gids(static_cast<std::size_t>(::getgroups(0, nullptr)));
  ASSERT_EQ(::getgroups(static_cast<int>(gids.size()), gids.data()), static_cast<int>(gids.size()));
  gids.insert(gids.begin(), ::getegid());
  EXPECT_EQ(std::vector<gid_t>(peer.value().gids.begin(), peer.value().gids.end()), gids);
  EXPECT_FALSE(ipc::peerOfSocket(STDIN_FILENO));
}

}  // namespace
}  // namespace veltrad::platform
