// What every back end has: event numbers, versions, digests.
#include "backends/backend.h"

#include <gtest/gtest.h>

#include "fakes/machine.h"

namespace veltrad {
namespace {

TEST(VeltraBackend, NumbersMessagesAndParsesVersions) {
  struct Counting final : backends::VeltraBackend {
    explicit Counting(platform::Random& random) : backends::VeltraBackend("x", "", random) {}
    using backends::VeltraBackend::sendMessage;
    std::optional<std::string> sendMessage(const Dictionary*, platform::TimeValue, std::uint16_t,
                                           std::uint16_t, std::uint16_t eventID, std::int32_t) override {
      return std::to_string(eventID);
    }
  };
  FakeRandom random;
  const auto backend = std::make_shared<Counting>(random);
  EXPECT_EQ(backend->sendMessage(nullptr, {}, 0, 0, 0), "1");
  for (int i = 2; i < 65'536; ++i) backend->sendMessage(nullptr, {}, 0, 0, 0);
  EXPECT_EQ(backend->sendMessage(nullptr, {}, 0, 0, 0), "0");
  EXPECT_EQ(backend->sendMessage(nullptr, {}, 0, 0, 0), "1");
  for (const auto& [text, major, minor] :
       {std::tuple{"9.3", 9, 3}, {"10", 10, 0}, {"300.1", 44, 1}, {"x.y", 0, 0}, {"8.0.7", 8, 0}}) {
    backend->setSelfVersion(text);
    EXPECT_EQ(backend->selfVersionMajor(), major) << text;
    EXPECT_EQ(backend->selfVersionMinor(), minor) << text;
  }
  EXPECT_EQ(backends::VeltraBackend::convertIntoSHA256("").substr(0, 8), "e3b0c442");
}

}  // namespace
}  // namespace veltrad
