// SPDX-License-Identifier: Apache-2.0
// What every back end has: event numbers, versions, digests, facts.
#include "backends/backend.h"

#include <gtest/gtest.h>

#include <thread>

#include "fakes/machine.h"

namespace veltrad {
namespace {

struct Counting final : backends::VeltraBackend {
  explicit Counting(platform::Random& random) : backends::VeltraBackend("x", "", random) {}
  backends::Sent sendNumberedMessage(backends::NumberedMessage&& message) override {
    return {{}, std::to_string(message.eventID)};
  }
};

TEST(VeltraBackend, NumbersMessagesAndParsesVersions) {
  FakeRandom random;
  const auto backend = std::make_shared<Counting>(random);
  EXPECT_EQ(backend->sendMessage(std::nullopt, {}, 0, 0, 0).text, "1");
  for (int i = 2; i < 65'536; ++i) backend->sendMessage(std::nullopt, {}, 0, 0, 0);
  EXPECT_EQ(backend->sendMessage(std::nullopt, {}, 0, 0, 0).text, "0");
  EXPECT_EQ(backend->sendMessage(std::nullopt, {}, 0, 0, 0).text, "1");
  for (const auto& [text, major, minor] :
       {std::tuple{"9.3", 9, 3}, {"10", 10, 0}, {"300.1", 44, 1}, {"x.y", 0, 0}, {"8.0.7", 8, 0}}) {
    const auto version = backends::SelfVersion::of(text);
    EXPECT_EQ(version.major, major) << text;
    EXPECT_EQ(version.minor, minor) << text;
  }
  EXPECT_EQ(backends::VeltraBackend::convertIntoSHA256("").substr(0, 8), "e3b0c442");
}

// User info comes from the session's own thread, the combined session ID from any: neither undoes the other.
TEST(VeltraBackend, ItsFactsChangeAsAWholeAndOnlyWhereTheyAreToldTo) {
  FakeRandom random;
  Counting backend(random);
  auto facts = std::make_shared<backends::SessionFacts>();
  facts->sessionID = 7;
  backend.setFacts(facts);
  std::thread other([&] {
    for (int i = 0; i <= 1000; ++i) backend.setCorrelatedSessionID("ancestor." + std::to_string(i));
  });
  for (int i = 0; i <= 1000; ++i)
    backend.setUserInfoDict(
        {std::make_shared<const Dictionary>(Dictionary{{"number", i}}), nullptr, nullptr});
  other.join();
  const auto now = backend.facts();
  EXPECT_EQ(now->sessionID, 7u);
  EXPECT_EQ(now->combinedSessionIDString, "ancestor.1000");
  EXPECT_EQ(now->userInfo->int32("number"), 1000);
  EXPECT_TRUE(!facts->userInfo && !facts->combinedSessionIDString);  // shared with other back ends
}

}  // namespace
}  // namespace veltrad
