// Bytes of a client, through the reader of frames and the decoding of calls. The first byte says in which
// pieces the rest arrives; the frames must not depend on it.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "ipc/dispatcher.h"
#include "ipc/frame.h"

namespace {

using namespace veltrad;

// Answers every call, each in another way.
class AnsweringSession final : public ClientSessionInterface {
 public:
  std::size_t calls = 0;

  void setSessionInfo(OptionalDictionary, OptionalDictionary, std::optional<Array>, bool) override {
    ++calls;
  }
  void startConfigWithCompletionHandler(NamesReply reply) override {
    answer(reply, std::vector<std::string>{"httppost"});
  }
  void fetchStatesWithUserInfo(OptionalDictionary, NamesReply reply) override { answer(reply, std::nullopt); }
  void fetchDisplayURL(StringReply reply) override { answer(reply, "URL not available"); }
  void sendMessageWithCategory(std::uint16_t, std::uint16_t, OptionalDictionary payload,
                               StringReply reply) override {
    const std::string* text = payload ? payload->string("text") : nullptr;
    answer(reply, text ? std::optional<std::string>(*text) : std::nullopt);
  }
  void sendMessageWithDictionary(Dictionary, StringReply) override { ++calls; }  // never answers
  void flushMessagesWithCompletion(FlushReply reply) override { answer(reply, "flushed", std::nullopt); }
  void finishSessionWithReply(StringReply reply) override { answer(reply, std::nullopt); }
  void uploadFileAtPath(std::string, std::string token, BooleanReply reply) override {
    if (!token.empty()) std::abort();
    answer(reply, true);
  }
  void uploadLogData(Array data, UploadLogDataReply reply) override {
    answer(reply, data.empty(), makeReportingError("refused", 403));
  }
  void sendMessageWithSessionInfo(OptionalDictionary, OptionalDictionary, std::uint16_t, std::uint16_t,
                                  OptionalDictionary, StringReply reply) override {
    answer(reply, "finished");
  }
  void end() override {}
  std::string description() const override { return "answering session"; }

 private:
  template <typename R, typename... Results>
  void answer(const R& reply, Results... results) {
    ++calls;
    if (reply) reply(std::move(results)...);
  }
};

struct Seen {
  std::vector<std::string> bodies;
  std::size_t readable = 0;
  std::size_t calls = 0;
  bool impossible = false;
  bool operator==(const Seen&) const = default;
};

Seen feed(const std::uint8_t* bytes, std::size_t size, std::size_t piece) {
  static platform::Counters counters;
  static const auto out = std::make_shared<ipc::OutQueue>(platform::FileDescriptor(), counters);
  AnsweringSession session;
  ipc::FrameReader reader;
  Seen seen;
  while (size > 0 && !seen.impossible) {
    const std::size_t count = std::min(size, piece);
    std::memcpy(reader.room(count).first, bytes, count);
    reader.received(count);
    bytes += count;
    size -= count;
    ipc::Frame frame;
    auto next = reader.next(frame);
    for (; next == ipc::FrameReader::Next::frame; next = reader.next(frame)) {
      seen.bodies.emplace_back(frame.body);
      if (!ipc::dispatchCall(frame, session, out)) ++seen.readable;
    }
    seen.impossible = next == ipc::FrameReader::Next::impossible;
  }
  seen.calls = session.calls;
  // A call is run exactly when it is readable.
  if (seen.calls != seen.readable) std::abort();
  return seen;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::size_t piece = data[0] == 0 ? size : data[0];
  if (!(feed(data + 1, size - 1, size) == feed(data + 1, size - 1, piece))) std::abort();
  return 0;
}
