// SPDX-License-Identifier: Apache-2.0
// A day's file of the history as a kill, a full disk or another program may leave it. The reader stays within
// the file and ends, and everything after the last intact record is cut off for good. A record with the input
// as its body, followed by the input, is read back unchanged.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "support/history_file.h"

namespace {

using namespace veltrad;
using support::HistoryFile;
using support::HistoryPlace;

void expect(bool held) {
  if (!held) std::abort();
}

FileDescriptor fileOf(std::string_view bytes) {
  FileDescriptor file(::memfd_create("history", MFD_CLOEXEC));
  expect(file.isOpen() && writeAll(file.get(), bytes) == 0);
  return file;
}

std::string recordOf(std::string_view header, std::string_view body) {
  std::string record = support::historyLengths(header.size(), body.size());
  record.append(header).append(body);
  return record + support::historyChecksum(support::historyCRC(0, record));
}

// Returns where the last intact record ends.
std::uint64_t walk(const HistoryFile& file) {
  std::uint64_t end = 0, intact = 0;
  for (auto place = file.at(0); place; place = file.at(end)) {
    expect(place->offset == end && place->end() > end && place->end() <= file.size());
    end = place->end();
    const auto header = file.header(*place);
    expect(file.body(*place, 0, place->bodyBytes + 1).size() == place->bodyBytes);
    expect(file.body(*place, place->bodyBytes, 1).empty());
    if (file.isIntact(*place)) intact = end;
  }
  expect(file.intactEnd() == intact);
  return intact;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view input(reinterpret_cast<const char*>(data), size);
  const std::uint64_t end = walk(HistoryFile(fileOf(input)));
  expect(walk(HistoryFile(fileOf(input.substr(0, end)))) == end);

  const std::string record = recordOf(R"({"id":"1"})", input);
  const HistoryFile file(fileOf(record + std::string(input)));
  expect(walk(file) >= record.size());
  const auto place = file.at(0);
  expect(place && file.isIntact(*place) && file.body(*place, 0, size) == input);
  expect(file.header(*place)->contains("id"));
  return 0;
}
