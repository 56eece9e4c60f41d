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

// The signals' mask is a thread's own, so each test runs on one that ends with it.
template <typename Body>
void onOwnThread(Body body) {
  std::thread thread(body);
  thread.join();
}

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
  platform::FileDescriptor reading;
  platform::FileDescriptor writing;
};

TEST(LineReader, givesLinesAndTheirNumbers) {
  onOwnThread([] {
    Interrupt interrupt;
    Pipe pipe;
    LineReader lines(pipe.reading.get(), 8, interrupt);
    pipe.write("one\n\n12345678\n123456789\nafter\nla");
    const struct {
      Got got;
      const char* line;
    } expected[] = {{Got::line, "one"},
                    {Got::line, ""},
                    {Got::line, "12345678"},
                    {Got::tooLong, ""},
                    {Got::line, "after"}};
    std::uint64_t number = 0;
    for (const auto& e : expected) {
      EXPECT_EQ(lines.next(), e.got);
      EXPECT_EQ(lines.line(), e.line);
      EXPECT_EQ(lines.number(), ++number);
    }
    pipe.write("st");
    pipe.writing.reset();
    EXPECT_EQ(lines.next(), Got::line);
    EXPECT_EQ(lines.line(), "last");
    EXPECT_EQ(lines.next(), Got::end);
    EXPECT_EQ(lines.number(), 6u);
  });
}

TEST(LineReader, keepsNothingOfALineThatIsFarTooLong) {
  onOwnThread([] {
    Interrupt interrupt;
    Pipe pipe;
    LineReader lines(pipe.reading.get(), 1000, interrupt);
    std::thread writer([&pipe] {
      const std::string block(100'000, 'x');
      for (int count = 0; count < 20; ++count) pipe.write(block);
      pipe.write("\nshort\n");
    });
    EXPECT_EQ(lines.next(), Got::tooLong);
    EXPECT_EQ(lines.line(), "");
    EXPECT_EQ(lines.next(), Got::line);
    EXPECT_EQ(lines.line(), "short");
    writer.join();
  });
}

TEST(LineReader, saysThatItCannotRead) {
  onOwnThread([] {
    Interrupt interrupt;
    const platform::FileDescriptor directory(open("/", 0));
    LineReader lines(directory.get(), 8, interrupt);
    EXPECT_EQ(lines.next(), Got::failed);
    EXPECT_EQ(errno, EISDIR);
  });
}

TEST(Interrupt, endsAWaitForALine) {
  onOwnThread([] {
    Interrupt interrupt;
    Pipe pipe;
    LineReader lines(pipe.reading.get(), 8, interrupt);
    interrupt.begin();
    pthread_kill(pthread_self(), SIGINT);
    EXPECT_EQ(lines.next(), Got::interrupted);
    EXPECT_EQ(interrupt.wait(-1, std::chrono::hours(1)), Interrupt::Wake::interrupted);
  });
}

TEST(Interrupt, waitsForTheTimeItWasGiven) {
  onOwnThread([] {
    Interrupt interrupt;
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(interrupt.wait(-1, std::chrono::milliseconds(20)), Interrupt::Wake::timeout);
    EXPECT_GE(std::chrono::steady_clock::now() - before, std::chrono::milliseconds(20));
  });
}

}  // namespace
}  // namespace veltrad::ctl
