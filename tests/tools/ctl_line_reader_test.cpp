// Lines of bounded length from a pipe, and the wait that a signal ends.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <thread>

#include "tools/ctl/line_reader.h"

namespace veltrad::ctl {
namespace {

using Got = LineReader::Got;

struct Pipe {
  Pipe() {
    int ends[2];
    if (pipe(ends) != 0) std::abort();
    reading = platform::FileDescriptor(ends[0]);
    writing = platform::FileDescriptor(ends[1]);
  }
  void write(std::string_view text) {
    ASSERT_EQ(::write(writing.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
  }
  platform::FileDescriptor reading, writing;
};

TEST(LineReader, givesLinesAndTheirNumbersAndKeepsNothingOfLongOnes) {
  Interrupt interrupt;
  Pipe pipe;
  LineReader lines(pipe.reading.get(), 8, interrupt);
  std::thread writer(
      [&pipe] { pipe.write("one\n\n12345678\n123456789\n" + std::string(500'000, 'x') + "\nafter\nla"); });
  const std::pair<Got, const char*> expected[] = {{Got::line, "one"},      {Got::line, ""},
                                                  {Got::line, "12345678"}, {Got::tooLong, ""},
                                                  {Got::tooLong, ""},      {Got::line, "after"}};
  std::uint64_t number = 0;
  for (const auto& [got, line] : expected) {
    EXPECT_EQ(lines.next(), got);
    EXPECT_EQ(lines.line(), line);
    EXPECT_EQ(lines.number(), ++number);
  }
  writer.join();
  pipe.write("st");
  pipe.writing.reset();
  EXPECT_EQ(lines.next(), Got::line);
  EXPECT_EQ(lines.line(), "last");
  EXPECT_EQ(lines.next(), Got::end);
  EXPECT_EQ(lines.number(), 7u);
}

TEST(LineReader, saysThatItCannotRead) {
  Interrupt interrupt;
  const platform::FileDescriptor directory(open("/", 0));
  LineReader lines(directory.get(), 8, interrupt);
  EXPECT_EQ(lines.next(), Got::failed);
  EXPECT_EQ(errno, EISDIR);
}

TEST(Interrupt, endsWaitsAndTimeDoesToo) {
  // The signals' mask is a thread's own, so it ends with this one.
  std::thread([] {
    Interrupt interrupt;
    Pipe pipe;
    LineReader lines(pipe.reading.get(), 8, interrupt);
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(interrupt.wait(-1, std::chrono::milliseconds(20)), Interrupt::Wake::timeout);
    EXPECT_GE(std::chrono::steady_clock::now() - before, std::chrono::milliseconds(20));
    interrupt.begin();
    pthread_kill(pthread_self(), SIGINT);
    EXPECT_EQ(lines.next(), Got::interrupted);
    EXPECT_EQ(interrupt.wait(-1, std::chrono::hours(1)), Interrupt::Wake::interrupted);
  }).join();
}

}  // namespace
}  // namespace veltrad::ctl
