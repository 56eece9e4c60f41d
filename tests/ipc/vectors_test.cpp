// SPDX-License-Identifier: Apache-2.0
// The frames of docs/wire-protocol.md, byte for byte, against the code.
#include <fstream>
#include <map>
#include <sstream>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

using wire::makeFrame;

// Every fence "```hex NAME" of the document.
std::map<std::string, std::string> documentedFrames() {
  std::ifstream document(VELTRA_SOURCE_DIR "/docs/wire-protocol.md");
  std::map<std::string, std::string> frames;
  std::string* open = nullptr;
  for (std::string line; std::getline(document, line);) {
    if (line.rfind("```", 0) == 0) {
      open = line.rfind("```hex ", 0) == 0 ? &frames[line.substr(7)] : nullptr;
    } else if (open) {
      std::istringstream pairs(line);
      for (std::string pair; pairs >> pair;) *open += static_cast<char>(std::stoi(pair, nullptr, 16));
    }
  }
  return frames;
}

TEST(Vectors, OfTheDocumentAreWhatTheCodeWrites) {
  const auto error = [](const char* description) {
    return Dictionary{
        {"error",
         Dictionary{{"domain", "com.florn.veltra.error"}, {"code", -1}, {"description", description}}}};
  };
  const Dictionary payload{{"codec", "opus"}, {"seconds", 12.5}, {"muted", false}};
  const std::map<std::string, std::string> written{
      {"client-hello", helloFrame()},
      {"daemon-hello", wire::makeFrame(wire::FrameKind::hello, 0, {{"wire", 1}, {"daemon", "8.0"}})},
      {"call", callFrame(1, operation::kSendMessage, {{"category", 5}, {"type", 1}, {"payload", payload}})},
      {"call-without-reply", wire::makeFrame(wire::FrameKind::call, 0, {{"op", operation::kStartConfig}})},
      {"call-with-descriptor",
       callFrame(0x01020304, operation::kUploadFile, {{"path", "/a"}}, wire::FrameKind::call, 1)},
      {"large-call",
       callFrame(2, operation::kUploadLogData, {{"data", Array{"one", 2}}}, wire::FrameKind::largeCall)},
      {"reply",
       wire::makeFrame(wire::FrameKind::reply, 1, {{"results", Dictionary{{"reply", "queued \u2713"}}}})},
      {"reply-none", wire::makeFrame(wire::FrameKind::reply, 1, {{"results", Dictionary{}}})},
      {"reply-error", wire::makeFrame(wire::FrameKind::reply, 1, error("The daemon gave no reply."))},
      {"event",
       wire::makeFrame(wire::FrameKind::event, 0,
                       {{"op", wire::event::kSendMessageToClient},
                        {"args", Dictionary{{"timestamp", 1.5}, {"category", 65535}, {"type", 2}}}})},
      {"remove-event", wire::makeFrame(wire::FrameKind::event, 0,
                                       {{"op", wire::event::kRemoveUploadedFile},
                                        {"args", Dictionary{{"call", 0x01020304}}}})},
      {"goodbye-event",
       wire::makeFrame(wire::FrameKind::event, 0,
                       {{"op", wire::event::kGoodbye}, {"args", Dictionary{{"calls", 3u}}}})},
      {"refusal", wire::makeFrame(wire::FrameKind::refusal, 0,
                                  error("The client speaks wire version 2, the daemon speaks version 1."))},
  };
  EXPECT_EQ(documentedFrames(), written);
}

}  // namespace
}  // namespace veltrad::ipc_test
