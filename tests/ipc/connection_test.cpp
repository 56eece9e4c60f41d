// How connections begin and end: greeting, refusals, broken frames, descriptors, floods, the stop.
#include <fcntl.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

std::string header(std::uint32_t length, FrameKind kind, std::uint8_t descriptors = 0) {
  std::string bytes(ipc::kFrameHeaderBytes, '\0');
  ipc::encodeFrameHeader({length, kind, descriptors, 1}, bytes.data());
  return bytes;
}

struct Pipe {
  Pipe() {
    int ends[2];
    EXPECT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    read = platform::FileDescriptor(ends[0]);
    write = platform::FileDescriptor(ends[1]);
  }
  // Every copy of the writing end was closed: the reader sees the end.
  bool writersGone() {
    write.reset();
    pollfd watched{read.get(), POLLIN, 0};
    return ::poll(&watched, 1, 20'000) == 1 && (watched.revents & POLLHUP) != 0;
  }
  platform::FileDescriptor read;
  platform::FileDescriptor write;
};

TEST(Connection, IsRefusedWithoutTheEntitlementInAFrameThatAClientReadsEvenIfItWroteFirst) {
  Door door(false);
  Client client = door.client();
  // More than the daemon will ever read; it may shut the door in the middle.
  client.send(Client::helloFrame() + std::string(100'000, 'x'));
  const auto refusal = client.receive();
  ASSERT_TRUE(refusal);
  EXPECT_EQ(refusal->kind, FrameKind::refusal);
  EXPECT_EQ(
      refusal->description(),
      "Connection refused: this peer (uid " + std::to_string(::getuid()) + ", gid " +
          std::to_string(::getgid()) +
          ", unit none) does not hold the entitlement \"com.florn.private.veltrad\"; add a rule for it to " +
          door.root.entitlementsPath() + ".");
  EXPECT_TRUE(client.atEnd());
  EXPECT_EQ(door.stop(), 0u);
  EXPECT_TRUE(door.journal.lines().empty());
  EXPECT_EQ(door.counters.value("connection refused: the peer does not hold the entitlement"), 1u);
}

TEST(Connection, EndsWhenTheClientBreaksTheProtocolAndSaysHow) {
  const std::string hello = Client::helloFrame();
  const std::vector<std::pair<std::string, const char*>> cases{
      {Client::callFrame(1, kSend, message(1, 1)),
       "The first frame must be a hello (kind 1), not of kind 2."},
      {Client::helloFrame(2), "The client speaks wire version 2, the daemon speaks version 1."},
      {Client::helloFrame("1"), "\"wire\" must be a number"},
      {header(0, FrameKind::hello), "The hello cannot be read"},
      {"GET / HTTP/1.1\r\n\r\n", "A frame of 1195725856 bytes"},
      {hello + header(ipc::kFrameBodyLimit + 1, FrameKind::call), "at most 1048576"},
      {hello + header(ipc::kLargeFrameBodyLimit + 1, FrameKind::largeCall), "at most 67108864"},
      {hello + header(4, FrameKind::call, 2), "with 2 descriptors"},
      {hello + Client::callFrame(1, kSend, message(1, 1), FrameKind::call, 1),
       "A frame announced a descriptor, and none came."},
  };
  Door door;
  for (const auto& [bytes, why] : cases) {
    SCOPED_TRACE(why);
    Client client = door.client();
    client.send(bytes);
    auto last = client.receive();
    if (last && last->kind == FrameKind::hello) last = client.receive();
    ASSERT_TRUE(last);
    EXPECT_EQ(last->kind, FrameKind::refusal);
    EXPECT_NE(last->description().find(why), std::string::npos) << last->description();
    EXPECT_TRUE(client.atEnd());
  }
  ASSERT_TRUE(door.journal.waitForLines(2 * cases.size()));
  EXPECT_EQ(door.stop(), 0u);
  EXPECT_EQ(door.counters.value("connection ended: the client broke the protocol"), cases.size());
}

TEST(Connection, EndsInOrder) {
  Door door;
  Client client = door.client();
  client.greet();
  // The last words of a client that does not wait for their answers.
  for (int i = 0; i < 1000; ++i) client.call(1, kSend, message(1, i));
  client.close();
  ASSERT_TRUE(door.journal.waitFor("end"));
  const auto lines = door.journal.lines();
  ASSERT_EQ(lines.size(), 1002u);
  EXPECT_EQ(lines[999], "sendMessage 1 999 {codec=opus}");
  EXPECT_EQ(lines[1000], "invalidated");
  EXPECT_EQ(lines[1001], "end");
}

TEST(Connection, TakesADescriptorWithItsFrameAndClosesItAfterTheCall) {
  Door door;
  Client client = door.client();
  client.greet();
  const char* upload = "uploadFileAtPath:extensionToken:completionHandler:";
  Pipe first;
  Pipe second;
  const auto frame = [&](std::uint32_t id) {
    return Client::callFrame(id, upload, {{"path", "/a"}}, FrameKind::call, 1);
  };
  client.send(frame(1), {first.write.get()});
  EXPECT_EQ(client.receive()->results(), "{uploaded=true}");
  EXPECT_TRUE(first.writersGone());
  // Two frames in one message, in pieces afterwards: the descriptors queue.
  const std::string both = frame(2) + frame(3);
  client.send(both.substr(0, 20), {second.write.get(), second.write.get()});
  client.waitUntilRead();
  client.send(both.substr(20));
  EXPECT_EQ(client.receive()->callID, 2u);
  EXPECT_EQ(client.receive()->callID, 3u);
  EXPECT_TRUE(second.writersGone());
  client.call(4, kSend, message(1, 1));
  EXPECT_EQ(client.receive()->callID, 4u);
}

TEST(Connection, EndsOverDescriptorsThatNoFrameAnnouncedAndKeepsNone) {
  for (const int count : {1, 3, 30}) {
    SCOPED_TRACE(count);
    Door door;
    Client client = door.client();
    client.greet();
    Pipe lent;
    // A partial frame may hold one descriptor back for a while, never many.
    client.send(Client::callFrame(1, kSend, message(1, 1)),
                std::vector<int>(static_cast<std::size_t>(count), lent.write.get()));
    auto last = client.receive();
    if (last && last->kind == FrameKind::reply) last = client.receive();
    ASSERT_TRUE(last);
    EXPECT_EQ(last->kind, FrameKind::refusal);
    EXPECT_TRUE(client.atEnd());
    EXPECT_TRUE(lent.writersGone());
  }
}

TEST(Connection, ServesOthersWhileOneBlocks) {
  Gate gate;
  Door door;
  door.onMessage = [&](std::uint16_t category, StringReply reply) {
    if (category == 1) gate.pass();
    reply("served");
  };
  Client blocked = door.client();
  blocked.greet();
  blocked.call(1, kSend, message(1, 1));
  ASSERT_TRUE(door.journal.waitFor("sendMessage 1 1 {codec=opus}"));
  Client half = door.client();  // and while another stalls inside a frame
  half.send(Client::helloFrame().substr(0, 30));
  Client other = door.client();
  other.greet();
  other.call(2, kSend, message(2, 2));
  EXPECT_EQ(other.receive()->results(), "{reply=served}");
  gate.open();
  EXPECT_EQ(blocked.receive()->results(), "{reply=served}");
  half.close();
}

TEST(Events, ReachTheClientBetweenItsReplies) {
  Door door;
  Client client = door.client();
  client.greet();
  std::vector<std::string> failures;
  const auto remote = door.remote(0, [&](const std::string& why) { failures.push_back(why); });
  remote->sendMessageToClient(Dictionary{{"sessionID", 4}}, 1.5, 65535, 2, Dictionary{{"a", 1}});
  remote->sendMessageToClient(std::nullopt, 0, 0, 0, std::nullopt);
  remote->sendMessageToClient(std::nullopt, 0, 0, 0, Dictionary{{"long", std::string(1'200'000, 'x')}});
  const auto event = client.receive();
  ASSERT_TRUE(event);
  EXPECT_EQ(event->kind, FrameKind::event);
  EXPECT_EQ(event->callID, 0u);
  EXPECT_EQ(textOf(Value(event->body)),
            "{args={category=65535 payload={a=1} sessionInfo={sessionID=4} timestamp=1.5 type=2} "
            "op=sendMessageToClient:timestamp:category:type:payload:}");
  const auto last = client.receive();
  ASSERT_TRUE(last);
  EXPECT_EQ(textOf(*last->body.find("args")), "{category=0 timestamp=0 type=0}");
  client.close();
  ASSERT_TRUE(door.journal.waitFor("end"));
  EXPECT_EQ(door.stop(), 0u);
  remote->sendMessageToClient(std::nullopt, 0, 0, 0, std::nullopt);
  ASSERT_EQ(failures.size(), 2u);
  EXPECT_NE(failures[0].find("is larger than a frame may be"), std::string::npos) << failures[0];
  EXPECT_EQ(failures[1], "The client has gone.");
}

TEST(Events, ToAClientThatDoesNotReadAreBoundedAndCounted) {
  Door door;
  Client client = door.client();
  client.greet();
  std::atomic<unsigned> failed{0};
  const auto remote = door.remote(0, [&](const std::string&) { ++failed; });
  constexpr unsigned kSent = 10'000;
  const Dictionary payload{{"text", std::string(1000, 'x')}};
  std::vector<std::thread> senders;
  for (int i = 0; i < 2; ++i) {
    senders.emplace_back([&] {
      for (unsigned n = 0; n < kSent / 2; ++n) remote->sendMessageToClient(std::nullopt, 1, 1, 1, payload);
    });
  }
  for (auto& sender : senders) sender.join();
  EXPECT_GT(failed.load(), kSent / 2);
  EXPECT_EQ(door.counters.value("event dropped: the client does not read"), failed.load());
  // What was not dropped is all there, whole, and the connection goes on.
  client.call(5, kSend, message(1, 1));
  unsigned events = 0;
  auto frame = client.receive();
  for (; frame && frame->kind == FrameKind::event; frame = client.receive()) ++events;
  ASSERT_TRUE(frame);
  EXPECT_EQ(frame->callID, 5u);
  EXPECT_EQ(events + failed.load(), kSent);
}

TEST(Replies, ThatNobodyReadsHoldTheCallsBackUntilTheyAreRead) {
  Door door;
  door.onMessage = [](std::uint16_t, StringReply reply) { reply(std::string(10'000, 'x')); };
  Client client = door.client();
  client.greet();
  constexpr std::uint32_t kCalls = 1000;
  std::thread writer([&] {
    for (std::uint32_t id = 1; id <= kCalls; ++id) client.call(id, kSend, message(1, 1));
  });
  for (std::uint32_t id = 1; id <= kCalls; ++id) {
    const auto reply = client.receive();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->callID, id);
  }
  writer.join();
}

TEST(Replies, FromElsewhereThatNobodyReadsEndTheConnection) {
  Door door;
  std::vector<StringReply> held;
  door.onMessage = [&](std::uint16_t, StringReply reply) {
    held.push_back(std::move(reply));
    if (held.size() == 300) door.journal.add("all held");
  };
  Client client = door.client();
  client.greet();
  for (std::uint32_t id = 1; id <= 300; ++id) client.call(id, kSend, message(1, static_cast<int>(id)));
  ASSERT_TRUE(door.journal.waitFor("all held"));
  for (const StringReply& reply : held) reply(std::string(10'000, 'x'));
  ASSERT_TRUE(door.journal.waitFor("end"));
  EXPECT_GE(door.counters.value("connection ended: the client does not read its replies"), 1u);
  client.close();
}

TEST(Stop, RunsFramesThatArrivedWholeAndTakesNoMore) {
  Gate gate;
  Door door;
  door.onMessage = [&](std::uint16_t category, StringReply reply) {
    if (category == 1) gate.pass();
    reply("served");
  };
  Client client = door.client();
  client.greet();
  client.call(1, kSend, message(1, 1));
  ASSERT_TRUE(door.journal.waitFor("sendMessage 1 1 {codec=opus}"));
  client.call(2, kSend, message(2, 2));
  client.send(Client::callFrame(3, kSend, message(3, 3)).substr(0, 40));
  Client idle = door.client();
  idle.greet();
  std::thread stopping([&] { EXPECT_EQ(door.stop(), 0u); });
  EXPECT_TRUE(idle.atEnd());
  // The stop has reached the blocked connection once it takes no more bytes.
  const auto deadline = soon();
  while (client.send("x")) ASSERT_LT(std::chrono::steady_clock::now(), deadline);
  gate.open();
  EXPECT_EQ(client.receive()->callID, 1u);
  EXPECT_EQ(client.receive()->callID, 2u);
  EXPECT_TRUE(client.atEnd());
  stopping.join();
  EXPECT_FALSE(std::filesystem::exists(door.root.socketPath()));
  const auto lines = door.journal.lines();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "end"), 2);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "sendMessage 2 2 {codec=opus}"), 1);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "sendMessage 3 3 {codec=opus}"), 0);
}

TEST(Stop, WaitsForACallNoLongerThanItsDeadlineAndRunsNoOtherAfterIt) {
  Gate gate;
  Door door;
  door.onMessage = [&](std::uint16_t, StringReply) { gate.pass(); };
  Client client = door.client();
  client.greet();
  for (std::uint32_t id = 1; id <= 3; ++id) client.call(id, kSend, message(1, static_cast<int>(id)));
  ASSERT_TRUE(door.journal.waitFor("sendMessage 1 1 {codec=opus}"));
  EXPECT_EQ(door.stop(10ms), 1u);
  gate.open();
  ASSERT_TRUE(door.journal.waitFor("end"));
  EXPECT_EQ(door.journal.lines(),
            (std::vector<std::string>{"sendMessage 1 1 {codec=opus}", "invalidated", "end"}));
}

TEST(Listener, RefusesConnectionsBeyondItsBoundsAndNamesThem) {
  Door door(true, 3, 2);
  auto first = std::make_unique<Client>(door.client());
  Client second = door.client();
  first->greet();
  second.greet();
  Client third = door.client();
  const auto refusal = third.receive();
  ASSERT_TRUE(refusal);
  EXPECT_EQ(refusal->kind, FrameKind::refusal);
  EXPECT_EQ(refusal->description(), "Connection refused: uid " + std::to_string(::getuid()) +
                                        " has 2 connections open, and no more are taken of one user.");
  EXPECT_TRUE(third.atEnd());
  EXPECT_EQ(door.counters.value("connection refused: too many connections of one user"), 1u);
  first.reset();
  ASSERT_TRUE(door.journal.waitFor("end"));
  // The place is free as soon as the thread has ended; until then the refusal is right.
  const auto deadline = soon();
  while (true) {
    Client again = door.client();
    again.send(Client::helloFrame());
    const auto answer = again.receive();
    ASSERT_TRUE(answer);
    if (answer->kind == FrameKind::hello) break;
    ASSERT_LT(std::chrono::steady_clock::now(), deadline);
  }
  Door narrow(true, 1, 2);
  Client only = narrow.client();
  only.greet();
  EXPECT_EQ(narrow.client().receive()->description(),
            "Connection refused: 1 connections are open, and no more are taken.");
}

TEST(Listener, BoundsWhatUnfinishedFramesHoldTogether) {
  Door door(true, 4096, 1024, 1u << 20);
  const std::string most =
      Client::callFrame(1, "uploadLogData:completionHandler:", {{"data", Array{std::string(900'000, 'x')}}},
                        FrameKind::largeCall);
  for (int round = 0; round < 3; ++round) {  // what a connection held comes back with its end, or its frame's
    SCOPED_TRACE(round);
    Client first = door.client();
    first.greet();
    first.send(most.substr(0, 800'000));
    first.waitUntilRead();
    Client second = door.client();
    second.greet();
    second.send(most.substr(0, 800'000));
    const auto refusal = second.receive();
    ASSERT_TRUE(refusal);
    EXPECT_EQ(refusal->description(),
              "Too many bytes of unfinished frames wait in the daemon; try again later.");
    EXPECT_TRUE(second.atEnd());
    first.send(most.substr(800'000));
    ASSERT_TRUE(first.receive());
    first.call(2, kSend, message(1, 1));
    ASSERT_TRUE(first.receive());
    ASSERT_TRUE(door.journal.waitForLines(static_cast<std::size_t>(4 * round + 4)));
    Client third = door.client();
    third.greet();
    third.send(most);
    EXPECT_EQ(third.receive()->callID, 1u);
    third.close();
    first.close();
    ASSERT_TRUE(door.journal.waitForLines(static_cast<std::size_t>(9 * (round + 1))));
  }
}

TEST(Listener, ComesThroughAFullTableOfDescriptors) {
  Door door;
  Client before = door.client();
  before.greet();
  Client waiting = door.client();
  waiting.greet();
  // A client whose socket is there already when the table fills up.
  platform::FileDescriptor late(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  std::vector<platform::FileDescriptor> fill;
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  const rlimit few{256, usual.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &few), 0);
  while (true) {
    platform::FileDescriptor one(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    if (!one.isOpen()) break;
    fill.push_back(std::move(one));
  }
  ASSERT_EQ(errno, EMFILE);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, door.root.socketPath().c_str(), sizeof address.sun_path - 1);
  ASSERT_EQ(::connect(late.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  Client refused{std::move(late)};
  const auto refusal = refused.receive();
  ASSERT_TRUE(refusal);
  EXPECT_EQ(refusal->description(),
            "Connection refused: the daemon has no descriptor left; try again later.");
  EXPECT_TRUE(refused.atEnd());
  before.call(1, kSend, message(1, 1));
  EXPECT_EQ(before.receive()->callID, 1u);
  fill.clear();
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
  door.client().greet();
  door.log.expectLine(platform::LogLevel::warning,
                      "listener: A connection could not be accepted: Too many open files");
}

}  // namespace
}  // namespace veltrad::ipc_test
