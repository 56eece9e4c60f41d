// SPDX-License-Identifier: Apache-2.0
// Bytes of a client, through the reader of frames and the decoding of calls. The first byte says in which
// pieces the rest arrives; the frames must not depend on it.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "fakes/answering_session.h"
#include "ipc/dispatcher.h"
#include "wire/frame.h"

namespace {

using namespace veltrad;

// The bodies of the frames, whether the end was an impossible one, and the calls that were run.
using Seen = std::tuple<std::vector<std::string>, bool, std::size_t>;

Seen feed(const std::uint8_t* bytes, std::size_t size, std::size_t piece) {
  static platform::Counters counters;
  static const auto out = std::make_shared<ipc::OutQueue>(FileDescriptor(), counters, nullptr);
  static const auto account = platform::MemoryBudget().accountOf(0);
  AnsweringSession session;
  wire::FrameReader reader;
  std::vector<std::string> bodies;
  std::size_t readable = 0;
  auto next = wire::FrameReader::Next();
  while (size > 0 && next != wire::FrameReader::Next::impossible) {
    const std::size_t count = std::min(size, piece);
    std::memcpy(reader.room(count).first, bytes, count);
    reader.received(count);
    bytes += count;
    size -= count;
    for (wire::Frame frame; (next = reader.next(frame)) == wire::FrameReader::Next::frame;) {
      bodies.emplace_back(frame.body);
      ipc::CallMemory memory{account,
                             *account->tryCharge(3 * frame.body.size(), platform::MemoryUse::working),
                             counters, [] {}, [] { return true; }};
      if (!ipc::dispatchCall(frame, session, out, memory) && !memory.usedUp) ++readable;
    }
  }
  if (session.calls != readable) std::abort();  // a call is run exactly when it is readable
  return {std::move(bodies), next == wire::FrameReader::Next::impossible, readable};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::size_t piece = data[0] == 0 ? size : data[0];
  if (feed(data + 1, size - 1, size) != feed(data + 1, size - 1, piece)) std::abort();
  return 0;
}
