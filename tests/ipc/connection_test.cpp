// SPDX-License-Identifier: Apache-2.0
// How connections begin and end: greeting, refusals, broken frames, descriptors, floods, the stop.
#include <fcntl.h>
#include <poll.h>

#include <atomic>
#include <new>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

using ::testing::ElementsAre;

struct Pipe {
  Pipe() {
    int ends[2];
    EXPECT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    read = FileDescriptor(ends[0]);
    write = FileDescriptor(ends[1]);
  }
  // Every copy of the writing end was closed: the reader sees the end.
  bool writersGone() {
    write.reset();
    pollfd watched{read.get(), POLLIN, 0};
    return ::poll(&watched, 1, 20'000) == 1 && (watched.revents & POLLHUP) != 0;
  }
  FileDescriptor read;
  FileDescriptor write;
};

// The client reads why it is refused (after what may have come before), and then the end.
std::string refusalOf(WireEnd& client) {
  Received last = client.next();
  if (last.kind == wire::FrameKind::hello || last.kind == wire::FrameKind::reply) last = client.next();
  EXPECT_EQ(last.kind, wire::FrameKind::refusal);
  EXPECT_TRUE(client.atEnd());
  return last.description();
}

TEST(Connection, EndsWhenTheClientBreaksTheProtocolAndSaysHow) {
  const std::string hello = helloFrame();
  const std::vector<std::pair<std::string, const char*>> cases{
      {messageFrame(1), "The first frame must be a hello (kind 1), not of kind 2."},
      {helloFrame(2), "The client speaks wire version 2, the daemon speaks version 1."},
      {helloFrame("1"), "\"wire\" must be a number"},
      {rawFrame(wire::FrameKind::hello, ""), "The hello cannot be read"},
      {"GET / HTTP/1.1\r\n\r\n", "A frame of 1195725856 bytes"},
      {hello + rawFrame(wire::FrameKind::call, "", wire::kFrameBodyLimit + 1), "at most 1048576"},
      {hello + rawFrame(wire::FrameKind::largeCall, "", wire::kLargeFrameBodyLimit + 1), "at most 16777216"},
      {hello + rawFrame(wire::FrameKind::call, "", 4, 2), "with 2 descriptors"},
      {hello + rawFrame(wire::FrameKind::call, "body", {}, 1),
       "A frame announced a descriptor, and none came."},
  };
  Door door;
  for (const auto& [bytes, why] : cases) {
    WireEnd client = door.stranger();
    client.send(bytes);
    EXPECT_THAT(refusalOf(client), HasSubstr(why));
  }
  ASSERT_TRUE(door.journal.waitForLines(2 * cases.size()));
  EXPECT_EQ(door.counters.value(wire::Reason::protocol_broken), cases.size());
}

TEST(Connection, TakesADescriptorWithItsFrameAndKeepsNone) {
  Door door;
  WireEnd client = door.client();
  Pipe first;
  Pipe second;
  const auto frame = [](std::uint32_t id) {
    return callFrame(id, operation::kUploadFile, {{"path", "/a"}}, wire::FrameKind::call, 1);
  };
  client.send(frame(1), {first.write.get()});
  EXPECT_EQ(client.next().results(), R"({"uploaded":true})");
  EXPECT_TRUE(first.writersGone());
  // Two frames in one message, in pieces afterwards: the descriptors queue.
  const std::string both = frame(2) + frame(3);
  client.send(both.substr(0, 20), {second.write.get(), second.write.get()});
  client.waitUntilRead();
  client.send(both.substr(20) + messageFrame(4));
  for (const std::uint32_t id : {2u, 3u, 4u}) EXPECT_EQ(client.next().callID, id);
  EXPECT_TRUE(second.writersGone());
  for (const std::size_t count : {1u, 3u, 30u}) {  // that no frame announced
    WireEnd other = door.client();
    Pipe lent;
    other.send(messageFrame(1), std::vector<int>(count, lent.write.get()));
    EXPECT_NE(refusalOf(other), "");
    EXPECT_TRUE(lent.writersGone()) << count;
  }
}

// A listener whose messages of category 1 wait at a gate.
struct GatedDoor : Door {
  GatedDoor() {
    onMessage = [this](std::uint16_t category, wire::SentReply reply) {
      if (category == 1) gate.pass();
      if (reply) reply("served", {});
    };
  }
  WireEnd blockedClient() {
    WireEnd blocked = client();
    blocked.send(messageFrame(1, 1));
    EXPECT_TRUE(journal.waitFor("sendMessage 1 1 none"));
    return blocked;
  }
  Gate gate;
};

// A session whose start waits at a gate.
class StartingSession final : public AnsweringSession {
 public:
  explicit StartingSession(Gate& gate) : _gate(gate) {}
  void startConfigWithCompletionHandler(wire::NamesReply reply) override {
    _gate.pass();
    AnsweringSession::startConfigWithCompletionHandler(std::move(reply));
  }

 private:
  Gate& _gate;
};

struct ForgetfulDoor : Door {
  struct Session final : AnsweringSession {
    explicit Session(ForgetfulDoor& itsDoor) : door(itsDoor) {}
    void takeNews() override {
      if (door.lacksMemory) throw std::bad_alloc();
      door.journal.add("news");
    }
    ForgetfulDoor& door;
  };
  bool listener(ipc::Listener&, const std::shared_ptr<ipc::Connection>& connection) override {
    connection->setExportedObject(std::make_shared<Session>(*this));
    connection->resume();
    connection->nudge();
    return true;
  }
  std::atomic<bool> lacksMemory{true};
};

TEST(Connection, TakesItsNewsLaterIfThereIsNoMemoryAlsoForASilentClient) {
  ForgetfulDoor door;
  const WireEnd client = door.client();
  EXPECT_EQ(door.journal.lines(), std::vector<std::string>());
  door.lacksMemory = false;
  EXPECT_TRUE(door.journal.waitForLines(1));
}

struct StartingDoor : Door {
  bool listener(ipc::Listener&, const std::shared_ptr<ipc::Connection>& connection) override {
    connection->setExportedObject(std::make_shared<StartingSession>(gate));
    connection->resume();
    return true;
  }
  Gate gate;
};

TEST(Replies, OfCallsThatCameTogetherDoNotWaitForOneThatBlocks) {
  StartingDoor door;
  WireEnd client = door.client();
  client.send(messageFrame(1) + messageFrame(2) + callFrame(3, operation::kStartConfig) + messageFrame(4));
  for (const std::uint32_t answered : {1u, 2u}) EXPECT_EQ(client.next().callID, answered);
  door.gate.open();
  for (const std::uint32_t answered : {3u, 4u}) EXPECT_EQ(client.next().callID, answered);
}

TEST(Replies, FromElsewhereThatNobodyReadsEndTheConnection) {
  Door door;
  std::vector<wire::SentReply> held;
  door.onMessage = [&](std::uint16_t, wire::SentReply reply) {
    held.push_back(std::move(reply));
    if (held.size() == 300) door.journal.add("all held");
  };
  WireEnd client = door.client();
  for (std::uint32_t id = 1; id <= 300; ++id) client.send(messageFrame(id));
  ASSERT_TRUE(door.journal.waitFor("all held"));
  for (const wire::SentReply& reply : held) reply(std::string(10'000, 'x'), {});
  ASSERT_TRUE(door.journal.waitFor("end"));
  EXPECT_GE(door.counters.value(wire::Reason::replies_unread), 1u);
  held.clear();  // before the counters go
}

// The client reads how many of its calls were run, and then the end.
void expectGoodbye(WireEnd& client, unsigned calls) {
  const Received last = client.next();
  EXPECT_EQ(last.kind, wire::FrameKind::event);
  EXPECT_EQ(last.op(), "goodbye");
  EXPECT_EQ(formats::writeJSON(last.args()), "{\"calls\":" + std::to_string(calls) + "}");
  EXPECT_TRUE(client.atEnd());
}

TEST(Stop, RunsFramesThatArrivedWholeSaysHowManyAndTakesNoMore) {
  GatedDoor door;
  WireEnd client = door.blockedClient();
  // A call without a reply counts, and so does one that cannot be read; an unfinished one does not.
  client.send(messageFrame(0, 2, 2) + callFrame(2, "launch:") + messageFrame(3, 3, 3).substr(0, 40));
  WireEnd idle = door.client();
  WireEnd silent = door.stranger();
  std::thread stopping([&] { EXPECT_EQ(door.stop(), 0u); });
  expectGoodbye(idle, 0);
  EXPECT_TRUE(silent.atEnd());
  // The stop has reached the blocked connection once it takes no more bytes.
  const auto deadline = within(kPatience);
  while (client.send("x")) ASSERT_LT(std::chrono::steady_clock::now(), deadline);
  door.gate.open();
  EXPECT_EQ(client.next().callID, 1u);
  EXPECT_EQ(client.next().callID, 2u);
  expectGoodbye(client, 3);
  stopping.join();
  EXPECT_FALSE(std::filesystem::exists(door.root.socketPath()));
  const auto lines = door.journal.lines();
  // The silent one may have been turned away before it had a session.
  EXPECT_GE(std::count(lines.begin(), lines.end(), "end"), 2);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "sendMessage 2 2 none"), 1);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "sendMessage 3 3 none"), 0);
}

TEST(Stop, WaitsForACallNoLongerThanItsDeadlineAndRunsNoOtherAfterIt) {
  GatedDoor door;
  WireEnd client = door.blockedClient();
  client.send(messageFrame(2) + messageFrame(3));
  EXPECT_EQ(door.stop(10ms), 1u);
  door.gate.open();
  EXPECT_EQ(client.next().callID, 1u);
  expectGoodbye(client, 1);
  EXPECT_THAT(door.journal.lines(), ElementsAre("sendMessage 1 1 none", "invalidated", "end"));
}

// A place is free as soon as the thread has ended; until then the refusal is right.
wire::FrameKind answerOnceThereIsRoom(Door& door) {
  const auto deadline = within(kPatience);
  wire::FrameKind answer{};
  while (answer != wire::FrameKind::hello && std::chrono::steady_clock::now() < deadline) {
    WireEnd again = door.stranger();
    again.send(helloFrame());
    answer = again.next().kind;
  }
  return answer;
}

TEST(Listener, RefusesConnectionsBeyondItsBoundsAndNamesThem) {
  Door door(3, 2);
  WireEnd first = door.client();
  WireEnd second = door.client();
  WireEnd third = door.stranger();
  EXPECT_EQ(refusalOf(third), "Connection refused: uid " + std::to_string(::getuid()) +
                                  " has 2 connections open, and no more are taken of one user.");
  EXPECT_EQ(door.counters.value(wire::Reason::too_many_of_user), 1u);
  first.close();
  ASSERT_TRUE(door.journal.waitFor("end"));
  EXPECT_EQ(answerOnceThereIsRoom(door), wire::FrameKind::hello);
  Door narrow(1, 2);
  WireEnd only = narrow.client();
  WireEnd other = narrow.stranger();
  EXPECT_EQ(refusalOf(other), "Connection refused: 1 connections are open, and no more are taken.");
}

TEST(Listener, EndsAConnectionThatFindsNoMemoryAndTakesTheNext) {
  Door door(1, 1);
  door.refusesMemory = true;
  EXPECT_TRUE(door.stranger().atEnd());
  EXPECT_EQ(door.counters.value(wire::Reason::call_out_of_memory), 1u);
  EXPECT_EQ(answerOnceThereIsRoom(door), wire::FrameKind::hello);
}

TEST(Listener, BoundsWhatUnfinishedFramesHoldTogether) {
  platform::MemoryBounds bounds;
  bounds.userUnfinished = 2u << 20;
  Door door(4096, 1024, bounds);
  const std::string most =
      callFrame(1, operation::kSendMessage,
                {{"category", 1}, {"type", 1}, {"payload", Dictionary{{"x", std::string(900'000, 'x')}}}});
  WireEnd boasting = door.client();  // what a header declares holds nothing
  boasting.send(rawFrame(wire::FrameKind::largeCall, "", wire::kLargeFrameBodyLimit));
  boasting.waitUntilRead();
  boasting.send("x");
  boasting.waitUntilRead();
  for (std::size_t round = 0; round < 3;
       ++round) {  // what was held comes back with its frame's or client's end
    WireEnd first = door.client();
    first.send(most.substr(0, 800'000));
    first.waitUntilRead();
    WireEnd second = door.client();
    second.send(most.substr(0, 800'000));
    EXPECT_EQ(refusalOf(second), "Too many bytes of unfinished frames wait in the daemon; try again later.");
    first.send(most.substr(800'000));
    EXPECT_EQ(first.next().callID, 1u);
    first.send(messageFrame(2));
    EXPECT_EQ(first.next().callID, 2u);
    ASSERT_TRUE(door.journal.waitForLines(7 * round + 4));
    WireEnd third = door.client();
    third.send(most);
    EXPECT_EQ(third.next().callID, 1u);
    third.close();
    first.close();
    ASSERT_TRUE(door.journal.waitForLines(9 * (round + 1)));
  }
  EXPECT_EQ(door.journal.lines().size(), 27u) << "the boasting client was ended";
  EXPECT_EQ(door.counters.value(wire::Reason::unfinished_frames), 3u);
}

}  // namespace
}  // namespace veltrad::ipc_test
