// SPDX-License-Identifier: Apache-2.0
// The results for gzip streams that arrive in pieces.
#include "support/gunzip.h"

#include <gtest/gtest.h>

#include "support/gzip.h"

namespace veltrad::support {
namespace {

using State = Gunzip::State;

std::string packed(const std::string& text) {
  return *GzipCompressor().gzipDeflate({text}, 6);
}

// Returns how often it took.
int add(Gunzip& gunzip, std::string_view piece, const std::function<void(std::string_view)>& sink) {
  int times = 1;
  for (; gunzip.add(piece, sink) == State::open && !piece.empty(); ++times) continue;
  return times;
}

TEST(Gunzip, TellsWhatAStreamIs) {
  const std::string text(100'000, 'a');
  const std::string whole = packed(text);
  std::string wrongSum = whole;
  wrongSum[wrongSum.size() - 6] = static_cast<char>(wrongSum[wrongSum.size() - 6] ^ 1);
  const struct {
    const char* what;
    std::string bytes;
    std::uint64_t most;
    State state;
  } rows[] = {
      {"at the bound", whole, text.size(), State::ended},
      {"beyond the bound", whole, text.size() - 1, State::tooLarge},
      {"cut", whole.substr(0, whole.size() - 1), 1 << 20, State::open},
      {"nothing", "", 1 << 20, State::open},
      {"a tail", whole + "x", 1 << 20, State::tail},
      {"a second stream", whole + whole, 1 << 20, State::tail},
      {"a wrong sum", wrongSum, 1 << 20, State::broken},
      {"plain text", text, 1 << 20, State::broken},
  };
  for (const std::size_t piece : {std::size_t{1}, std::size_t{7}, std::size_t{1} << 20}) {
    for (const auto& row : rows) {
      SCOPED_TRACE(std::string(row.what) + ", in pieces of " + std::to_string(piece));
      Gunzip gunzip(row.most);
      std::string out;
      for (std::size_t at = 0; at < row.bytes.size(); at += piece)
        add(gunzip, std::string_view(row.bytes).substr(at, piece),
            [&out](std::string_view more) { out += more; });
      EXPECT_EQ(gunzip.state(), row.state);
      if (row.state == State::ended) EXPECT_EQ(out, text);
      EXPECT_LE(out.size(), row.most);
    }
  }
}

TEST(Gunzip, TakesASmallPieceThatBecomesLargeInManyTurns) {
  const std::pair<std::size_t, State> rows[] = {{32u << 20, State::ended}, {33u << 20, State::tooLarge}};
  for (const auto& [size, state] : rows) {
    const std::string bytes = packed(std::string(size, 'a'));
    Gunzip gunzip(1u << 30);
    std::size_t largest = 0;
    const int times =
        add(gunzip, bytes, [&](std::string_view more) { largest = std::max(largest, more.size()); });
    EXPECT_EQ(gunzip.state(), state) << size;
    EXPECT_LE(largest, 64u << 10);
    EXPECT_GE(times, 512);
  }
}

}  // namespace
}  // namespace veltrad::support
