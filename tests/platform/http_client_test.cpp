// The HTTP client against a real TLS server on loopback.
#include "platform/http_client.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>
#include <future>

#include "fakes/temporary_directory.h"
#include "fakes/tls_server.h"

namespace veltrad::platform {
namespace {

using namespace std::chrono_literals;
using testing::HasSubstr;
using testing::Not;
using Shape = TLSAnswer::Shape;

class HTTPClientTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { std::signal(SIGPIPE, SIG_IGN); }

  static HTTPRequest get(std::string url, HTTPRequest::Lane lane = HTTPRequest().lane) {
    HTTPRequest request;
    request.url = std::move(url);
    request.timeout = 20s;
    request.lane = lane;
    return request;
  }
  static HTTPRequest post(std::string url, std::string body) {
    HTTPRequest request = get(std::move(url));
    request.method = HTTPRequest::Method::post;
    request.body = std::move(body);
    return request;
  }
  std::future<HTTPResult> start(HTTPRequest request) {
    auto promise = std::make_shared<std::promise<HTTPResult>>();
    std::future<HTTPResult> future = promise->get_future();
    client.start(std::move(request), [promise](HTTPResult result) { promise->set_value(std::move(result)); });
    return future;
  }
  // A script that gives every request the same answer.
  static TLSServer::Script always(TLSAnswer answer) {
    return [answer = std::move(answer)](const TLSRequest&) { return answer; };
  }

  void trust(const TestCertificates& trusted) { place.write("ca.pem", trusted.authorityPEM()); }
  void SetUp() override { trust(certificates); }

  static inline const TLSAnswer kOK{200, {}, "ok"};
  static inline const TLSAnswer kSilent{200, {}, "", Shape::silent};
  const TestCertificates certificates;
  TLSServer hung{certificates, always(kSilent)};
  TLSServer healthy{certificates, always(kOK)};
  const TemporaryDirectory place;
  CurlHTTPClient client{{place.path("ca.pem")}};
};

#define EXPECT_TRANSPORT_ERROR(result, text)                                   \
  do {                                                                         \
    const HTTPResult& r = (result);                                            \
    ASSERT_FALSE(r.ok());                                                      \
    EXPECT_EQ(r.error().kind, HTTPError::Kind::transport);                     \
    EXPECT_THAT(r.error().description, text);                                  \
    EXPECT_THAT(r.error().description, Not(testing::ContainsRegex("[\r\n]"))); \
  } while (false)

TEST_F(HTTPClientTest, AnswersOfEveryShapeArriveWhole) {
  const std::vector<TLSAnswer> answers = {
      {200, {{"Last-Modified", "Tue, 01 Jul 2025 10:00:00 GMT"}}, "body"},
      {404, {}, "no such storebag"},
      {503, {{"Retry-After", "9"}, {"retry-after", "10"}}, ""},
      {304, {{"X-Empty", ""}}, ""},
      {302, {{"Location", "/other"}}, ""},  // not followed
      {200, {}, std::string(1'000'000, 'b')},
  };
  TLSServer server(certificates, [&](const TLSRequest& request) {
    return answers.at(std::stoul(request.head.substr(request.head.find('/') + 1)));
  });
  for (std::size_t i = 0; i < answers.size(); ++i) {
    SCOPED_TRACE(i);
    const HTTPResult result = client.perform(get(server.url("/" + std::to_string(i), "localhost")));
    ASSERT_TRUE(result.ok()) << result.error().description;
    EXPECT_EQ(result.value().status, answers[i].status);
    EXPECT_EQ(result.value().body, answers[i].body);
    for (const auto& header : answers[i].headers) {
      EXPECT_THAT(result.value().headers, testing::Contains(header));
    }
  }
  EXPECT_EQ(server.requests().size(), answers.size());
  EXPECT_EQ(server.connections(), 1u);  // kept alive
  const HTTPResponse response{200, {{"retry-AFTER", "9"}, {"Retry-After", "10"}}, ""};
  EXPECT_EQ(response.header("Retry-After"), "9");
  EXPECT_EQ(response.header("Retry"), std::nullopt);
}

TEST_F(HTTPClientTest, SendsExactlyWhatTheRequestSays) {
  TLSServer server(certificates, always({}));
  const std::string body(300'000, 'p');
  HTTPRequest request = post(server.url("/a?b=c"), body);
  request.headers = {
      {"User-Agent", "one\r\nInjected: yes"}, {"X-Empty", " \t"},           {"content-length", "5"},
      {"Transfer-Encoding", "chunked"},       {"Bad\r\nName", "value"},     {"Expect", "100-continue"},
      {"Content-Type", "application/json"},   {"X-Text", "caf\xc3\xa9\x7f"}};
  ASSERT_TRUE(client.perform(std::move(request)).ok());
  ASSERT_TRUE(client.perform(post(server.url(), "")).ok());
  const std::vector<TLSRequest> requests = server.requests();
  const std::string host = "Host: 127.0.0.1:" + std::to_string(server.port()) + "\r\n";
  EXPECT_EQ(requests.at(0).head,
            "POST /a?b=c HTTP/1.1\r\n" + host +
                "User-Agent: oneInjected: yes\r\nX-Empty:\r\nContent-Type: application/json\r\n"
                "X-Text: caf\xc3\xa9\r\nContent-Length: 300000\r\n\r\n");
  EXPECT_EQ(requests.at(0).body, body);
  EXPECT_EQ(requests.at(1).head, "POST / HTTP/1.1\r\n" + host + "Content-Length: 0\r\n\r\n");
}

TEST_F(HTTPClientTest, BadAnswersEndWithOneLine) {
  const struct {
    TLSAnswer answer;
    std::size_t most;
    const char* text;
  } cases[] = {
      {{200, {}, std::string(1000, 'x'), Shape::cut}, 16u << 20, ""},
      {{200, {}, "", Shape::endless}, 100'000, "The answer is larger than 100000 bytes"},
      {{200, {}, std::string(2000, 'x')}, 1000, "The answer is larger than 1000 bytes"},
      {{200, {}, "", Shape::endlessHead}, 100'000, "The answer is larger than 100000 bytes"},
      {{200, {}, "", Shape::endlessHead}, 16u << 20, "The answer's headers are larger than 262144 bytes"},
      {kSilent, 1000, "time"}};
  for (const auto& bad : cases) {
    TLSServer server(certificates, always(bad.answer));
    HTTPRequest request = get(server.url());
    request.mostResponseBytes = bad.most;
    if (bad.answer.shape == Shape::silent) request.timeout = 300ms;
    EXPECT_TRANSPORT_ERROR(client.perform(std::move(request)), HasSubstr(bad.text));
  }
}

TEST_F(HTTPClientTest, APostIsNeverSentTwice) {
  std::atomic<int> asked{0};
  TLSServer server(certificates, [&](const TLSRequest&) {
    return ++asked == 1 ? TLSAnswer{} : TLSAnswer{200, {}, "", Shape::hangUp};
  });
  ASSERT_TRUE(client.perform(post(server.url(), "kept alive")).ok());
  for (const char* connection : {"kept", "new"}) {
    EXPECT_TRANSPORT_ERROR(client.perform(post(server.url(), connection)), "Empty reply from server");
  }
  EXPECT_EQ(server.requests().size(), 3u);
}

TEST_F(HTTPClientTest, APostIsNotSentOnAKeptConnectionThatItsServerClosed) {
  TLSServer server(certificates, always({200, {}, "", TLSAnswer::Shape::thenCloses}));
  for (std::size_t sent = 1; sent <= 3; ++sent) {
    EXPECT_TRUE(client.perform(post(server.url(), "x")).ok());
    ASSERT_TRUE(server.waitForAllClosed());
    EXPECT_EQ(server.requests().size(), sent);
    EXPECT_EQ(server.connections(), sent);
  }
}

TEST_F(HTTPClientTest, UnreachableServersAreTransportErrors) {
  const std::string refused = TLSServer(certificates, always({})).url();
  EXPECT_TRANSPORT_ERROR(client.perform(get(refused)), HasSubstr("connect"));
  EXPECT_TRANSPORT_ERROR(client.perform(get("https://host.invalid/")),
                         "Could not resolve host: host.invalid");
  EXPECT_TRANSPORT_ERROR(client.perform(get("http://127.0.0.1:1/")), HasSubstr("http"));
  for (const char* none : {"", "https://a b\r\nc/"})
    EXPECT_TRANSPORT_ERROR(client.perform(get(none)), Not(testing::IsEmpty()));
}

TEST_F(HTTPClientTest, NothingIsSentToAServerThatIsNotTrusted) {
  const TestCertificates strange, otherName("DNS:elsewhere.example");
  {
    TLSServer server(strange, always({}));
    EXPECT_TRANSPORT_ERROR(client.perform(post(server.url(), "secret")), HasSubstr("certificate"));
    EXPECT_TRUE(server.waitForRefusedHandshake());
    EXPECT_EQ(server.applicationBytes(), 0u);
    trust(strange);  // the file is read again
    EXPECT_TRUE(client.perform(get(server.url())).ok());
  }
  trust(otherName);
  TLSServer server(otherName, always({}));
  EXPECT_TRANSPORT_ERROR(client.perform(post(server.url(), "secret")), HasSubstr("subject"));
  EXPECT_EQ(server.applicationBytes(), 0u);
}

TEST_F(HTTPClientTest, EventPostsAreBoundedAndStorebagsAreNot) {
  std::atomic<int> stopped{0};
  const auto countStopped = [&](HTTPResult result) {
    if (!result.ok() && result.error().kind == HTTPError::Kind::stopping) ++stopped;
  };
  for (int i = 0; i < 1024; ++i) client.start(post(hung.url(), "x"), countStopped);
  const HTTPResult refused = start(post(healthy.url(), "y")).get();
  ASSERT_FALSE(refused.ok());
  EXPECT_EQ(refused.error().kind, HTTPError::Kind::tooMany);
  EXPECT_EQ(refused.error().description, "Too many posts under way");
  EXPECT_EQ(client.underWay(), 1024u);

  ASSERT_TRUE(hung.waitForRequests(6));
  EXPECT_TRUE(client.perform(get(healthy.url(), HTTPRequest::Lane::storebag)).ok());
  client.drain(std::chrono::steady_clock::now());
  EXPECT_EQ(stopped, 1024);
  EXPECT_EQ(client.underWay(), 0u);
  EXPECT_LE(hung.mostOpen(), 8u);
  EXPECT_EQ(start(get(healthy.url())).get().error().kind, HTTPError::Kind::stopping);
}

TEST_F(HTTPClientTest, EventBodiesAreBoundedInAll) {
  auto first = start(post(hung.url(), std::string(40u << 20, 'x')));
  EXPECT_EQ(start(post(hung.url(), std::string(25u << 20, 'x'))).get().error().kind,
            HTTPError::Kind::tooMany);
}

TEST_F(HTTPClientTest, AHostThatHangsKeepsNoOtherWaitingAndWhatWaitsForItTimesOut) {
  std::vector<std::future<HTTPResult>> waiting;
  for (int i = 0; i < 20; ++i) {
    HTTPRequest request = post(hung.url(), "x");
    if (i >= 6) request.timeout = 100ms;
    waiting.push_back(start(std::move(request)));
  }
  EXPECT_TRUE(start(post(healthy.url(), "y")).get().ok());
  EXPECT_TRANSPORT_ERROR(waiting[19].get(), HasSubstr("while waiting for a connection to 127.0.0.1:"));
  auto asked = start(get(hung.url("/storebag"), HTTPRequest::Lane::storebag));
  EXPECT_TRUE(hung.waitForRequests(7));  // it reached even the host that hangs
}

TEST_F(HTTPClientTest, UploadsRunTwoAtATimeInOrder) {
  std::mutex mutex;
  std::condition_variable changed;
  int at = 0, most = 0;
  TLSServer server(certificates, [&](const TLSRequest&) {
    std::unique_lock lock(mutex);
    most = std::max(most, ++at);
    changed.notify_all();
    changed.wait_for(lock, 10s, [&] { return most >= 2; });  // the first waits for the second
    --at;
    return TLSAnswer{};
  });
  std::vector<std::future<HTTPResult>> uploads;
  for (int i = 0; i < 6; ++i) {
    HTTPRequest request = post(server.url("/" + std::to_string(i)), std::string(200'000, 'u'));
    request.lane = HTTPRequest::Lane::upload;
    request.leastBytesPerSecond = 1024;
    uploads.push_back(start(std::move(request)));
  }
  for (auto& upload : uploads) EXPECT_TRUE(upload.get().ok());
  EXPECT_EQ(most, 2);
}

TEST_F(HTTPClientTest, WaitersAreFreedAndLaterOnesFailAtOnce) {
  auto waiter = std::async(std::launch::async, [&] { return client.perform(get(hung.url())); });
  auto event = start(post(hung.url(), "x"));
  ASSERT_TRUE(hung.waitForRequests(2));
  client.failBlockingWaits();
  EXPECT_EQ(waiter.get().error().kind, HTTPError::Kind::stopping);
  EXPECT_EQ(client.perform(get(hung.url())).error().kind, HTTPError::Kind::stopping);
  EXPECT_EQ(client.underWay(), 1u);  // posts go on
}

TEST_F(HTTPClientTest, DrainWaitsForWhatEndsInTime) {
  std::atomic<int> done{0};
  for (int i = 0; i < 50; ++i) {
    client.start(post(healthy.url(), "x"), [&](HTTPResult result) { done += result.ok() ? 1 : 0; });
  }
  client.drain(std::chrono::steady_clock::now() + 20s);
  EXPECT_EQ(done, 50);
  EXPECT_TRUE(client.perform(get(healthy.url())).ok());
}

TEST_F(HTTPClientTest, TheDestructorEndsAllOnceEvenWhatCompletionsAskFor) {
  std::atomic<int> first{0}, second{0};
  {
    CurlHTTPClient mine({place.path("ca.pem")});
    for (int i = 0; i < 10; ++i) {
      mine.start(post(hung.url(), "x"), [&](HTTPResult) {
        ++first;
        mine.start(post(hung.url(), "again"), [&](HTTPResult result) {
          if (result.error().kind == HTTPError::Kind::stopping) ++second;
        });
      });
    }
    ASSERT_TRUE(hung.waitForRequests(6));
  }
  EXPECT_EQ(first, 10);
  EXPECT_EQ(second, 10);
}

TEST_F(HTTPClientTest, AnEmptyTaskPassesUnlessACompletionHoldsTheThread) {
  EXPECT_TRUE(client.passesEmptyTask(0ms));  // no thread yet
  std::promise<void> entered, leave;
  client.start(get("http://refused/"), [&](HTTPResult) {
    entered.set_value();
    leave.get_future().wait();
  });
  entered.get_future().wait();
  EXPECT_FALSE(client.passesEmptyTask(1ms));
  leave.set_value();
  EXPECT_TRUE(client.passesEmptyTask(10s));
}

}  // namespace
}  // namespace veltrad::platform
