// SPDX-License-Identifier: Apache-2.0
// The record of fates: the ring, and what its reader makes of it.
#include <gtest/gtest.h>

#include <atomic>
#include <cstring>
#include <thread>

#include "fakes/machine.h"
#include "platform/fate_writer.h"
#include "support/fate_book.h"

namespace veltrad {
namespace {

using platform::FateRing;
using wire::Fate;
using wire::Reason;
using wire::Step;

// Reads on from `next`; returns how many entries were missing.
std::uint64_t readOn(const FateRing& ring, support::FateReader& reader, std::uint64_t& next,
                     bool patient = true) {
  const FateRing::Copy copy = ring.copy(next, 1u << 20, patient);
  for (std::size_t at = 0; at < copy.entries.size(); at += 64) {
    std::uint64_t position = 0;
    wire::FateWords words;
    std::memcpy(&position, &copy.entries[at], 8);
    std::memcpy(words.data(), &copy.entries[at + 8], sizeof words);
    reader.read(position, words);
  }
  next = copy.next;
  return copy.missing;
}

struct Record {
  explicit Record(std::size_t bytes = FateRing::kLeastBytes) : ring(bytes, clock) {}

  std::uint64_t session(std::string_view client) {
    wire::SessionEntry entry;
    entry.client = FateRing::refTo(ring.intern(client));
    return ring.write(entry);
  }
  std::uint64_t message(std::uint64_t session) {
    wire::MessageEntry entry;
    entry.session = FateRing::refTo(session);
    entry.message = ring.nextMessage();
    ring.write(entry);
    return entry.message;
  }
  support::FateBook book() const {
    support::FateBook book;
    support::FateReader reader(book, ring.size());
    std::uint64_t next = 0;
    readOn(ring, reader, next);
    return book;
  }

  FakeClock clock;
  FateRing ring;
};

TEST(FateRing, OverwritesTheOldestAndSaysHowManyAReaderHasMissed) {
  Record record;
  const std::size_t size = record.ring.size();
  for (std::size_t i = 0; i < 2 * size + 5; ++i) record.message(0);
  const FateRing::Copy all = record.ring.copy(0, 1u << 20), some = record.ring.copy(size + 1, 10);
  EXPECT_EQ(all.entries.size(), size * 64);
  EXPECT_EQ(all.missing, size + 6);  // of positions from 0
  EXPECT_EQ(all.next, record.ring.next());
  EXPECT_EQ(some.missing, 5u);
  EXPECT_EQ(some.next, size + 16);
  EXPECT_EQ(record.ring.copy(some.next + size, 10).missing, 0u);
}

TEST(FateRing, ATextStandsAsLongAsTheLastEntryThatNamesIt) {
  Record record;
  const std::string texts[] = {"", "lamp", std::string(48, 'a'), std::string(49, 'b'), std::string(300, 'c')};
  // Far more than a round: each text is written anew before it is overwritten, and not more often.
  const std::size_t rounds = record.ring.size();
  for (std::size_t i = 0; i < rounds; ++i) {
    for (const std::string& text : texts) record.message(record.session(text));
  }
  EXPECT_EQ(record.ring.intern(texts[4]), record.ring.intern(texts[4]));
  EXPECT_LT(record.ring.next(), rounds * 13);
  std::size_t told = 0;
  std::map<std::string, int> seen;
  const support::FateBook book = record.book();
  for (const auto& [number, fates] : book.messages()) {
    if (!fates.message.session) continue;
    ++told;
    ++seen[*fates.message.session->client];
    EXPECT_EQ(*fates.message.session->client, texts[(number - 1) % std::size(texts)]);
  }
  EXPECT_EQ(seen.size(), std::size(texts));
  EXPECT_GT(told, record.ring.size() / 3);
  const std::string longest(5000, 'd');
  record.message(record.session(longest));
  EXPECT_EQ(record.book().messages().rbegin()->second.message.session->client,
            longest.substr(0, FateRing::kLongestText));
}

TEST(FateBook, FollowsAPostThroughTheSpool) {
  Record record;
  const platform::FateWriter pen(&record.ring, "httppost");
  const std::uint64_t message = record.message(record.session("lamp"));
  wire::StepEntry posted;
  posted.message = message;
  posted.post = 4;
  posted.bytes = 77;
  posted.text = pen.textOf("https://h.test/events");
  pen.write(Step::posted, std::nullopt, posted);
  wire::StepEntry kept;
  kept.post = 4;
  kept.bytes = 12 * 60;
  kept.text = pen.textOf("HTTP 503");
  pen.write(Step::kept, Reason::kept_in_spool, kept);
  const auto told = [&] { return record.book().messages().at(message).backends.at("httppost"); };
  EXPECT_TRUE(told().fate == Fate::kept && told().keptFor == "HTTP 503" && told().bytes == 77 &&
              told().url == "https://h.test/events");
  EXPECT_EQ(told().nextTry - told().road.back().entry.time, 720'000'000);
  wire::StepEntry end;
  end.post = 4;
  pen.write(Step::again, std::nullopt, end);
  end.status = 200;
  pen.write(Step::answered, Reason::event_posted, end);
  EXPECT_TRUE(told().fate == Fate::posted && told().status == 200 && told().road.size() == 4);
}

TEST(FateBook, FollowsEachMessageThroughItsBatchAndPost) {
  Record record;
  const platform::FateWriter https(&record.ring, "httppost"), dashboard(&record.ring, "dashboard");
  const auto session = record.session("lamp");
  const std::uint64_t messages[] = {record.message(session), record.message(session), record.message(session),
                                    record.message(session)};
  const auto of = [](std::uint64_t message, std::uint64_t batch = 0, std::uint64_t post = 0) {
    wire::StepEntry entry;
    entry.message = message;
    entry.batch = batch;
    entry.post = post;
    return entry;
  };
  const auto name = [&](Step step, const char* text, std::uint64_t message, std::uint64_t batch) {
    wire::NamesEntry names;
    names.step = step;
    names.backend = https.backend();
    names.message = message;
    names.batch = batch;
    names.names[names.count++] = FateRing::refTo(record.ring.intern(text));
    record.ring.write(names);
  };
  name(Step::removed, "mac", messages[0], 0);
  name(Step::hashed, "number", messages[0], 0);
  for (int i = 0; i < 3; ++i) https.write(Step::batched, std::nullopt, of(messages[i], 9));
  https.write(Step::dropped, Reason::batch_full, of(messages[1], 9));
  https.write(Step::flushed, std::nullopt, of(0, 9));
  name(Step::restored, "mac", 0, 9);
  https.write(Step::posted, std::nullopt, of(0, 9, 4));
  https.write(Step::held, std::nullopt, of(messages[3], 10));
  https.write(Step::dropped, Reason::flushed_unreported, of(0, 10));
  wire::StepEntry answer = of(0, 0, 4);
  answer.status = 503;
  https.write(Step::answered, Reason::server_error, answer);
  wire::StepEntry sent = of(messages[0]);
  sent.status = 1;
  dashboard.write(Step::sent, Reason::datagram_sent, sent);
  dashboard.write(Step::again, Reason::datagram_sent_again, of(messages[0]));
  dashboard.write(Step::acknowledged, Reason::datagram_acknowledged, of(messages[0]));
  dashboard.write(Step::sent, Reason::datagram_sent, sent = of(messages[1]));

  const support::FateBook book = record.book();
  const auto at = [&](int i, const char* backend) {
    return book.messages().at(messages[i]).backends.at(backend);
  };
  const std::tuple<int, const char*, Fate, std::optional<Reason>, std::optional<int>> rows[] = {
      {0, "httppost", Fate::posted, Reason::server_error, 503},
      {1, "httppost", Fate::dropped, Reason::batch_full, std::nullopt},
      {2, "httppost", Fate::posted, Reason::server_error, 503},
      {3, "httppost", Fate::dropped, Reason::flushed_unreported, std::nullopt},
      {0, "dashboard", Fate::acknowledged, std::nullopt, std::nullopt},
      {1, "dashboard", Fate::sent, std::nullopt, std::nullopt}};
  for (const auto& [i, backend, fate, reason, status] : rows) {
    const support::BackendFate told = at(i, backend);
    EXPECT_TRUE(told.fate == fate && told.reason == reason && told.status == status)
        << i << backend << wire::nameOf(told.fate);
  }
  EXPECT_EQ(at(0, "httppost").hashed, std::set<std::string>{"number"});
  EXPECT_TRUE(at(0, "httppost").removed.empty());
  EXPECT_EQ(at(0, "dashboard").transmissions, 2);
}

// Each entry that is read is one that was written, whole, whatever the others do meanwhile.
TEST(FateRing, ManyWriteWhileReadersFallBehind) {
  constexpr int kWriters = 4, kMessages = 20'000;
  Record record;
  std::atomic<int> writing{kWriters};
  std::vector<std::thread> threads;
  for (int writer = 0; writer < kWriters; ++writer) {
    threads.emplace_back([&record, &writing, writer] {
      const std::string client(static_cast<std::size_t>(40 + 10 * writer), static_cast<char>('a' + writer));
      const platform::FateWriter pen(&record.ring, "httppost");
      for (int i = 0; i < kMessages; ++i) {
        wire::StepEntry step;
        step.message = record.message(record.session(client));
        step.batch = step.post = step.message;
        pen.write(Step::posted, std::nullopt, step);
      }
      writing.fetch_sub(1);
    });
  }
  struct Checked final : support::FateReader::Listener {
    void taken(const support::ToldMessage& message) override {
      if (!message.session) return;
      const std::string& client = *message.session->client;
      whole += client == std::string(static_cast<std::size_t>(40 + 10 * (client[0] - 'a')), client[0]);
      ++read;
    }
    void stepped(const support::ToldStep& step) override {
      whole += step.entry.post == step.message && step.entry.batch == step.message;
      ++read;
    }
    std::uint64_t whole = 0, read = 0;
  } checked;
  support::FateReader reader(checked, record.ring.size());
  std::uint64_t next = 1, missing = 0;
  while (writing.load() > 0) missing += readOn(record.ring, reader, next);
  for (std::thread& thread : threads) thread.join();
  missing += readOn(record.ring, reader, next, false);
  EXPECT_EQ(next, record.ring.next());
  EXPECT_EQ(checked.whole, checked.read);
  EXPECT_GT(checked.read, 0u);
  EXPECT_EQ(record.ring.messages(), std::uint64_t{kWriters} * kMessages);
  if (checked.read < 2 * record.ring.messages()) {
    EXPECT_GT(missing, 0u);
  }
}

}  // namespace
}  // namespace veltrad
