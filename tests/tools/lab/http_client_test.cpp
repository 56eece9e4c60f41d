// SPDX-License-Identifier: Apache-2.0
// The HTTP client against the lab's real TLS server on loopback.
#include "http/http_client.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <csignal>
#include <future>
#include <new>
#include <thread>

#include "fakes/few_descriptors.h"
#include "fakes/temporary_directory.h"
#include "formats/json.h"
#include "tools/lab/server.h"

namespace veltrad::platform {
namespace {

using namespace std::chrono_literals;
using testing::HasSubstr;
using testing::Not;

// The lab with rules of its own, each for the requests below a path. Its first key and certificate serve all.
class Server {
 public:
  explicit Server(std::initializer_list<const char*> rules = {}, bool strange = false)
      : _directory(open(_place, strange)), _server(_directory, 60) {
    for (const char* rule : rules) _server.add(lab::ruleFromJSON(rule).value());
    EXPECT_EQ(_server.start(0, 0), std::nullopt);
  }
  std::string certificate() const { return _place.read("certificate.pem"); }
  std::string url(const std::string& path = "/") const { return _server.url() + path; }
  std::vector<Dictionary> requests() const {
    std::vector<Dictionary> requests;
    for (const char* kind : {"events", "storebags"}) {
      std::ifstream file(_directory.receivedPath(kind));
      for (std::string line; std::getline(file, line);)
        if (const auto read = formats::parseJSON(line)) requests.push_back(*read.value().asDictionary());
    }
    return requests;
  }
  bool waitForRequests(std::size_t count) const {
    const auto deadline = std::chrono::steady_clock::now() + 20s;
    while (requests().size() < count && std::chrono::steady_clock::now() < deadline)
      std::this_thread::yield();
    return requests().size() >= count;
  }

 private:
  static lab::Directory open(const TemporaryDirectory& place, bool strange) {
    static const TemporaryDirectory keys;
    static const auto made = lab::Directory::open(keys.path());
    for (const char* name : {"signing", "certificate.pem", "certificate-key.pem"})
      if (!strange || name[0] == 's')
        std::filesystem::copy(keys.path(name), place.path(name), std::filesystem::copy_options::recursive);
    return lab::Directory::open(place.path()).value();
  }

  const TemporaryDirectory _place;
  const lab::Directory _directory;
  lab::Server _server;
};

constexpr const char* kStall = R"({"path": "/", "stall": true})";

class HTTPClientTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { std::signal(SIGPIPE, SIG_IGN); }
  static http::HTTPRequest get(std::string url, http::HTTPRequest::Lane lane = http::HTTPRequest().lane) {
    http::HTTPRequest request;
    request.url = std::move(url);
    request.timeout = 20s;
    request.lane = lane;
    return request;
  }
  static http::HTTPRequest post(std::string url, std::string body,
                                http::HTTPRequest::Lane lane = http::HTTPRequest().lane) {
    http::HTTPRequest request = get(std::move(url), lane);
    request.method = http::HTTPRequest::Method::post;
    request.body = std::move(body);
    return request;
  }
  std::future<http::HTTPResult> start(http::HTTPRequest request) {
    auto promise = std::make_shared<std::promise<http::HTTPResult>>();
    std::future<http::HTTPResult> future = promise->get_future();
    const auto started = client.start(
        std::move(request), [promise](http::HTTPResult result) { promise->set_value(std::move(result)); });
    if (!started) promise->set_value(Failure{started.error()});
    return future;
  }

  const Server hung{kStall}, healthy;
  const TemporaryDirectory place;
  http::CurlHTTPClient client{{place.path("ca.pem")}};
  void SetUp() override { place.write("ca.pem", healthy.certificate()); }
};

#define EXPECT_TRANSPORT_ERROR(result, text) EXPECT_ERROR(result, transport, text)
#define EXPECT_ERROR(result, expected, text)                                   \
  do {                                                                         \
    const http::HTTPResult& r = (result);                                      \
    ASSERT_FALSE(r.ok());                                                      \
    EXPECT_EQ(r.error().kind, http::HTTPError::Kind::expected);                \
    EXPECT_THAT(r.error().description, text);                                  \
    EXPECT_THAT(r.error().description, Not(testing::ContainsRegex("[\r\n]"))); \
  } while (false)

TEST_F(HTTPClientTest, AnswersAreBounded) {
  const auto withHeaders = [](int count, std::size_t length) {
    std::string rule = R"({"path": "/", "status": 503, "body": "short", "headers": {"X": "x")";
    for (int i = 0; i < count; ++i)
      rule += ", \"X" + std::to_string(i) + "\": \"" + std::string(length, 'x') + '"';
    return rule + "}}";
  };
  const std::string endless = R"({"path": "/", "status": 503, "endless": true})";
  const std::string large = R"({"path": "/", "status": 503, "body": ")" + std::string(2000, 'x') + "\"}";
  constexpr std::size_t kMost = 16u << 20;
  // Kept or thrown away; the error, if it is one.
  const std::tuple<std::string, std::size_t, bool, std::optional<http::HTTPError::Kind>, const char*>
      cases[] = {
          {endless, kMost, true, http::HTTPError::Kind::tooLarge, "The answer is larger than 16777216 bytes"},
          {endless, kMost, false, std::nullopt, ""},
          {large, 1000, true, http::HTTPError::Kind::tooLarge, "The answer is larger than 1000 bytes"},
          {large, 1000, false, std::nullopt, ""},
          {withHeaders(6, 10'000), kMost, true, std::nullopt, "short"},
          {withHeaders(7, 10'000), kMost, true, http::HTTPError::Kind::transport,
           "headers are over 65536 bytes"},
          {withHeaders(200, 10), kMost, true, std::nullopt, "short"},
          {withHeaders(10'000, 10), kMost, false, http::HTTPError::Kind::transport,
           "65536 bytes or 256 lines"},
          {withHeaders(300, 10), kMost, true, http::HTTPError::Kind::transport, "65536 bytes or 256 lines"}};
  for (const auto& [rule, most, keeps, kind, text] : cases) {
    const Server server({rule.c_str()});
    http::HTTPRequest request = post(server.url("/x"), "{}");
    request.mostResponseBytes = most;
    request.keepsAnswer = keeps;
    const http::HTTPResult result = client.perform(std::move(request));
    ASSERT_EQ(result.ok(), !kind) << text << rule.substr(0, 80);
    EXPECT_EQ(result.ok() ? result.value().status : result.error().status, 503);
    if (kind) EXPECT_EQ(result.error().kind, *kind);
    EXPECT_THAT(result.ok() ? result.value().body : result.error().description, HasSubstr(text));
    if (result.ok()) EXPECT_EQ(result.value().header("x0").has_value(), keeps);
    if (!keeps && result.ok()) EXPECT_EQ(result.value().body, "");
  }
  http::HTTPRequest late = get(hung.url("/x"));
  late.timeout = 300ms;
  EXPECT_TRANSPORT_ERROR(client.perform(std::move(late)), HasSubstr("time"));
}

TEST_F(HTTPClientTest, SaysHowLongAServerAsksToWaitAlsoIfTheAnswerIsCut) {
  const std::pair<const char*, std::chrono::seconds> headers[] = {{"7", 7s},
                                                                  {"0", 0s},
                                                                  {"-5", 0s},
                                                                  {"soon", 0s},
                                                                  {"99999999", 86'400s},
                                                                  {"Wed, 21 Oct 2015 07:28:00 GMT", 0s},
                                                                  {"Wed, 21 Oct 2065 07:28:00 GMT", 86'400s}};
  for (const auto& [value, wait] : headers) {
    const std::string rule =
        std::string(R"({"path": "/", "status": 429, "headers": {"Retry-After": ")") + value + "\"}}";
    const Server server({rule.c_str()});
    http::HTTPRequest request = post(server.url("/x"), "");
    request.sharedBody = std::make_shared<const std::string>("\"shared\"");
    request.keepsAnswer = false;
    const http::HTTPResult result = client.perform(std::move(request));
    ASSERT_TRUE(result.ok());
    EXPECT_EQ(result.value().retryAfter, wait) << value;
    EXPECT_EQ(*server.requests()[0].string("body"), "shared");
  }
  const Server server(
      {R"({"path": "/", "cutHalfway": true, "body": "12345678", "headers": {"Retry-After": "9"}})"});
  const http::HTTPResult cut = client.perform(post(server.url("/x"), "{}"));
  ASSERT_FALSE(cut.ok());
  EXPECT_EQ(cut.error().retryAfter, 9s);
}

TEST_F(HTTPClientTest, AShortageOfDescriptorsPasses) {
  for (const bool started : {false, true}) {  // the HTTP thread
    for (const unsigned free : {0u, 2u}) {
      const FewDescriptors few(free);
      EXPECT_ERROR(client.perform(get("https://name.invalid/")), shortage, Not(testing::IsEmpty()));
      if (free > 0) continue;
      EXPECT_ERROR(client.perform(get(hung.url())), shortage, Not(testing::IsEmpty()));
      EXPECT_EQ(client.start(get(hung.url()), [](http::HTTPResult) {}).ok(), started);
    }
    EXPECT_TRUE(client.perform(post(healthy.url(), "1")).ok());
  }
}

// Has no memory for as many answers as the test says.
struct ShortGate final : http::RequestGate {
  using Refusal = std::optional<http::RequestRefusal>;
  static void answer(std::atomic<int>& shortages) {
    if (shortages > 0 && shortages-- > 0) throw std::bad_alloc();
  }
  Refusal refusal(bool, std::string_view) const override { return answer(refusals), std::nullopt; }
  Refusal count(const http::Departure&) override { return answer(counts), std::nullopt; }
  bool keepsRecords() const override { return true; }
  bool hasRoomForRecord() const override { return true; }
  std::uint64_t record(const http::Departure&, std::vector<std::string>, std::string_view,
                       std::shared_ptr<const FileDescriptor>) override {
    return answer(records), 1;
  }
  void refused(const http::Departure&) override {}
  void ended(std::uint64_t, const http::DepartureEnd&) override {}

  mutable std::atomic<int> refusals = 0;
  std::atomic<int> counts = 0, records = 0;
};

TEST_F(HTTPClientTest, ARequestThatNoMemoryCanBeHadForEndsAndOthersGoOn) {
  ShortGate gate;
  http::CurlHTTPClient asking{{place.path("ca.pem"), &gate}};
  for (std::atomic<int>* shortages : {&gate.refusals, &gate.counts, &gate.records}) {
    *shortages = 1;
    EXPECT_ERROR(asking.perform(post(healthy.url(), "1")), shortage, HasSubstr("memory"));
    EXPECT_TRUE(asking.perform(post(healthy.url(), "1")).ok());
  }
  EXPECT_EQ(asking.underWay(), 0u);
}

TEST_F(HTTPClientTest, NothingIsSentToAServerThatIsNotTrusted) {
  for (const char* none : {"http://127.0.0.1:1/", "", "https://a b\r\nc/"})
    EXPECT_TRANSPORT_ERROR(client.perform(get(none)), Not(testing::IsEmpty()));
  const Server strange({}, true);
  EXPECT_TRANSPORT_ERROR(client.perform(post(strange.url(), "secret")), HasSubstr("certificate"));
  const std::string port = strange.url("").substr(strange.url("").rfind(':'));
  place.write("ca.pem", strange.certificate());  // the file is read again
  // The same server under a name that its certificate does not hold.
  EXPECT_TRANSPORT_ERROR(client.perform(post("https://0.0.0.0" + port, "secret")), HasSubstr("subject"));
  EXPECT_TRUE(client.perform(post(strange.url(), "\"known\"")).ok());
  ASSERT_EQ(strange.requests().size(), 1u);
  EXPECT_EQ(*strange.requests()[0].string("body"), "known");
}

TEST_F(HTTPClientTest, EventPostsAreBoundedAndStorebagsAreNot) {
  std::atomic<int> stopped{0};
  platform::MemoryBudget budget;
  const auto account = budget.accountOf(1);
  for (int i = 0; i < 1024; ++i) {
    http::HTTPRequest request = post(hung.url(), "x");
    request.charge = *account->keep(1000);
    const auto taken = client.start(std::move(request), [&](http::HTTPResult result) {
      EXPECT_GE(account->used(), 1000u);  // its own is paid back later
      if (!result.ok() && result.error().kind == http::HTTPError::Kind::stopping) ++stopped;
    });
    EXPECT_TRUE(taken);
  }
  http::HTTPRequest one = post(healthy.url(), "y");
  one.charge = *account->keep(1000);
  const auto taken = client.start(std::move(one), [](http::HTTPResult) { ADD_FAILURE(); });
  ASSERT_FALSE(taken);
  EXPECT_EQ(taken.error().kind, http::HTTPError::Kind::tooMany);
  EXPECT_EQ(taken.error().description, "Too many posts under way");
  EXPECT_EQ(client.underWay(), 1024u);
  EXPECT_EQ(account->used(), 1'024'000u);

  ASSERT_TRUE(hung.waitForRequests(6));
  EXPECT_TRUE(client.perform(get(healthy.url("/x"), http::HTTPRequest::Lane::storebag)).ok());
  client.drain(std::chrono::steady_clock::now());
  EXPECT_EQ(stopped, 1024);
  EXPECT_EQ(client.underWay(), 0u);
  EXPECT_EQ(account->used(), 0u);
  EXPECT_LE(hung.requests().size(), 8u);
  EXPECT_EQ(start(get(healthy.url())).get().error().kind, http::HTTPError::Kind::stopping);
}

}  // namespace
}  // namespace veltrad::platform
