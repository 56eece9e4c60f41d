// SPDX-License-Identifier: Apache-2.0
// The options of a session: their ranges, a second description, and programs that were built with 8.0.
#include <dlfcn.h>

#include <cstddef>

#include "harness.h"

namespace veltrad::client_test {
namespace {

using ::testing::HasSubstr;

TEST(Options, OutsideTheirRangeAreRefusedWithIt) {
  FakeDaemon daemon(answerPlainly);
  for (const std::int32_t type : {-1, 18}) {
    const veltra::Session session{{.clientType = type, .root = daemon.root.directory()}};
    EXPECT_EQ(session.error().status, VELTRA_INVALID);
    EXPECT_THAT(session.error().description, HasSubstr("0 to 17"));
  }
  const veltra::Session broken{{.root = daemon.root.directory(), .frameworksToCheck = 5}};
  EXPECT_EQ(broken.error().description, "The frameworks to check are no array.");
  veltra::Session session = open(daemon);
  EXPECT_EQ(session.post(1, 1, {}, 4), VELTRA_INVALID);
  const veltra::Reply reply = session.sendAndWait(1, 1, {}, 4);
  EXPECT_EQ(reply.status, VELTRA_INVALID);
  EXPECT_THAT(reply.error->description, HasSubstr("0 to 3"));
  EXPECT_EQ(session.sendAndWait(1, 1, {}, VELTRA_FLAG_REALTIME | VELTRA_FLAG_OVERRIDE_SAMPLING).status,
            VELTRA_OK);
}

TEST(Options, OfALiveSessionCanBeGivenAnew) {
  Journal journal;
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.op() == operation::kSetSessionInfo) journal.add(formats::writeJSON(call.args()));
    answerPlainly(link, call);
  });
  const auto info = [](const char* frameworks, const char* aggregates, const char* type, const char* names) {
    return std::string("{") + frameworks + "\"hasAggregationBlock\":" + aggregates +
           ",\"sessionInfo\":{\"batchEvent\":false,\"clientType\":" + type + ",\"requireUserInfo\":false}" +
           names + "}";
  };
  const auto ignored = [](const veltra::Aggregated&) {};
  veltra::Session session{{.clientType = VELTRA_CLIENT_TYPE_JY,
                           .aggregated = ignored,
                           .root = daemon.root.directory(),
                           .frameworksToCheck = veltra::Array{"a", "b"}}};
  ASSERT_TRUE(session);
  EXPECT_EQ(session.describe({.clientType = 11, .clientName = "phone"}), VELTRA_OK);
  EXPECT_EQ(session.describe({.clientType = 18}), VELTRA_INVALID);
  ASSERT_TRUE(session.flush());
  EXPECT_THAT(journal.lines(), ElementsAre(info(R"("frameworksToCheck":["a","b"],)", "true", "7", ""),
                                           info("", "false", "11", R"(,"userInfo":{"clientName":"phone"})")));
  veltra::Session silent = open(daemon);  // has no callback that could get the copies
  EXPECT_EQ(silent.describe({.aggregated = ignored}), VELTRA_INVALID);
}

TEST(Options, OfAProgramThatWasBuiltWith80KeepTheirMeaning) {
  constexpr std::size_t kEnd = offsetof(veltra_session_options, undescribed) + sizeof(bool);
  constexpr std::size_t kSize = (kEnd + 7) / 8 * 8;
  // The struct of 8.0 ends here; the rest belongs to other data.
  union {
    veltra_session_options options;
    unsigned char bytes[sizeof(veltra_session_options)];
  } given;
  std::memset(given.bytes, 0xff, sizeof given.bytes);
  void* library = ::dlopen(VELTRA_LIBRARY, RTLD_NOW | RTLD_LOCAL);
  ASSERT_TRUE(library) << ::dlerror();
  const auto init = reinterpret_cast<void (*)(veltra_session_options*)>(
      ::dlvsym(library, "veltra_session_options_init", "VELTRA_8"));
  ASSERT_TRUE(init) << ::dlerror();
  init(&given.options);
  EXPECT_EQ(given.options.size, kSize);
  EXPECT_EQ(std::count(given.bytes + kSize, given.bytes + sizeof given.bytes, 0xff),
            std::ptrdiff_t{sizeof given.bytes - kSize});
  ::dlclose(library);

  FakeDaemon daemon(answerPlainly);
  const std::string root = daemon.root.directory();
  given.options.root = root.c_str();
  for (const std::size_t size : {kEnd, kSize, sizeof given.options}) {
    std::memset(given.bytes + kEnd, size < sizeof given.options ? 0xff : 0, sizeof given.bytes - kEnd);
    given.options.size = size;
    char* error = nullptr;
    const Handle session(veltra_session_create(&given.options, nullptr, &error), veltra_session_close);
    EXPECT_TRUE(session) << size << ": " << error;
    veltra_free(error);
  }
  given.options.size = kEnd - 1;
  veltra_status status{};
  EXPECT_FALSE(veltra_session_create(&given.options, &status, nullptr));
  EXPECT_EQ(status, VELTRA_INVALID);
}

}  // namespace
}  // namespace veltrad::client_test
