// SPDX-License-Identifier: Apache-2.0
// Replaces libFuzzer: passes each file of the corpus directories on the command line to the fuzz target. One
// thread.
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size);

int main(int count, char** arguments) {
  int replayed = 0;
  for (int i = 1; i < count; ++i) {
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(arguments[i], error)) {
      std::ifstream file(entry.path(), std::ios::binary);
      const std::string input((std::istreambuf_iterator<char>(file)), {});
      LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(input.data()), input.size());
      ++replayed;
    }
    if (error) {
      std::fprintf(stderr, "%s: %s\n", arguments[i], error.message().c_str());
      return 1;
    }
  }
  std::printf("%d inputs replayed\n", replayed);
  if (replayed == 0) std::fprintf(stderr, "no inputs, where at least one was expected\n");
  return replayed > 0 ? 0 : 1;
}
