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

TEST(LineReader, keepsNothingOfLongLinesAndSaysThatItCannotRead) {
  Interrupt interrupt;
  int ends[2];
  ASSERT_EQ(pipe(ends), 0);
  const platform::FileDescriptor reading(ends[0]), directory(open("/", 0));
  std::thread writer([writing = platform::FileDescriptor(ends[1])] {
    const std::string text = "12345678\n123456789\n" + std::string(500'000, 'x') + "\n\nlast";
    EXPECT_EQ(::write(writing.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
  });
  LineReader lines(reading.get(), 8, interrupt);
  std::uint64_t number = 0;
  for (const char* expected : {"12345678", "-", "-", "", "last"}) {
    EXPECT_EQ(lines.next(), *expected == '-' ? Got::tooLong : Got::line);
    EXPECT_EQ(lines.line(), *expected == '-' ? "" : expected);
    EXPECT_EQ(lines.number(), ++number);
  }
  EXPECT_EQ(lines.next(), Got::end);
  writer.join();
  EXPECT_EQ(LineReader(directory.get(), 8, interrupt).next(), Got::failed);
  EXPECT_EQ(errno, EISDIR);
}

TEST(Interrupt, endsWaitsAndTimeDoesToo) {
  // The signals' mask is a thread's own, so it ends with this one.
  std::thread([] {
    Interrupt interrupt;
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(interrupt.wait(-1, std::chrono::milliseconds(20)), Interrupt::Wake::timeout);
    EXPECT_GE(std::chrono::steady_clock::now() - before, std::chrono::milliseconds(20));
    interrupt.begin();
    pthread_kill(pthread_self(), SIGINT);
    EXPECT_EQ(interrupt.wait(-1, std::chrono::hours(1)), Interrupt::Wake::interrupted);
  }).join();
}

}  // namespace
}  // namespace veltrad::ctl
