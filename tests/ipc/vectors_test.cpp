// The frames of docs/wire-protocol.md, byte for byte, against the code; and the reader of frames alone.
#include <fstream>
#include <map>
#include <sstream>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

// Every fence "```hex NAME" of the document.
std::map<std::string, std::string> documentedFrames() {
  std::ifstream document(VELTRA_SOURCE_DIR "/docs/wire-protocol.md");
  std::map<std::string, std::string> frames;
  std::string* open = nullptr;
  for (std::string line; std::getline(document, line);) {
    if (line.rfind("```hex ", 0) == 0) {
      open = &frames[line.substr(7)];
    } else if (line == "```") {
      open = nullptr;
    } else if (open != nullptr) {
      std::istringstream pairs(line);
      for (std::string pair; pairs >> pair;) open->push_back(static_cast<char>(std::stoi(pair, nullptr, 16)));
    }
  }
  return frames;
}

std::string hex(std::string_view bytes) {
  std::string text;
  char pair[4];
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    std::snprintf(pair, sizeof pair, "%02x", static_cast<unsigned char>(bytes[i]));
    text += pair;
    text += i % 32 == 31 ? '\n' : ' ';
  }
  return text;
}

struct Vector {
  const char* name;
  FrameKind kind;
  std::uint32_t callID;
  std::uint8_t descriptors;
  Dictionary body;
};

const std::vector<Vector>& vectors() {
  static const Dictionary kError{
      {"domain", "com.florn.veltra.error"}, {"code", -1}, {"description", "The daemon gave no reply."}};
  static const std::vector<Vector> kVectors{
      {"client-hello", FrameKind::hello, 0, 0, {{"wire", 1}, {"library", "8.0"}}},
      {"daemon-hello", FrameKind::hello, 0, 0, {{"wire", 1}, {"daemon", "8.0"}}},
      {"call",
       FrameKind::call,
       1,
       0,
       {{"op", kSend},
        {"args",
         Dictionary{{"category", 5},
                    {"type", 1},
                    {"payload", Dictionary{{"codec", "opus"}, {"seconds", 12.5}, {"muted", false}}}}}}},
      {"call-without-reply", FrameKind::call, 0, 0, {{"op", "startConfigWithCompletionHandler:"}}},
      {"call-with-descriptor",
       FrameKind::call,
       0x01020304,
       1,
       {{"op", "uploadFileAtPath:extensionToken:completionHandler:"}, {"args", Dictionary{{"path", "/a"}}}}},
      {"large-call",
       FrameKind::largeCall,
       2,
       0,
       {{"op", "uploadLogData:completionHandler:"}, {"args", Dictionary{{"data", Array{"one", 2}}}}}},
      {"reply", FrameKind::reply, 1, 0, {{"results", Dictionary{{"reply", "queued \u2713"}}}}},
      {"reply-none", FrameKind::reply, 1, 0, {{"results", Dictionary{}}}},
      {"reply-error", FrameKind::reply, 1, 0, {{"error", kError}}},
      {"event",
       FrameKind::event,
       0,
       0,
       {{"op", "sendMessageToClient:timestamp:category:type:payload:"},
        {"args", Dictionary{{"timestamp", 1.5}, {"category", 65535}, {"type", 2}}}}},
      {"refusal",
       FrameKind::refusal,
       0,
       0,
       {{"error",
         Dictionary{{"domain", "com.florn.veltra.error"},
                    {"code", -1},
                    {"description", "The client speaks wire version 2, the daemon speaks version 1."}}}}},
  };
  return kVectors;
}

TEST(Vectors, OfTheDocumentAreWhatTheCodeWritesAndReads) {
  const auto documented = documentedFrames();
  EXPECT_EQ(documented.size(), vectors().size());
  for (const Vector& vector : vectors()) {
    SCOPED_TRACE(vector.name);
    const std::string written = ipc::makeFrame(vector.kind, vector.callID, vector.body, vector.descriptors);
    const auto found = documented.find(vector.name);
    ASSERT_NE(found, documented.end()) << hex(written);
    EXPECT_EQ(hex(found->second), hex(written));
    ipc::FrameReader reader;
    const auto [place, size] = reader.room(found->second.size());
    std::memcpy(place, found->second.data(), found->second.size());
    reader.received(found->second.size());
    ipc::Frame frame;
    ASSERT_EQ(reader.next(frame), ipc::FrameReader::Next::frame);
    EXPECT_EQ(frame.header.kind, vector.kind);
    EXPECT_EQ(frame.header.callID, vector.callID);
    EXPECT_EQ(frame.header.descriptors, vector.descriptors);
    const auto body = parseBinaryPropertyList(frame.body);
    ASSERT_TRUE(body) << body.error().detail;
    EXPECT_EQ(body.value(), Value(vector.body));
    EXPECT_TRUE(reader.empty());
  }
}

TEST(FrameReader, NeverMakesRoomForWhatAHeaderDeclares) {
  ipc::FrameReader reader;
  std::string bytes(ipc::kFrameHeaderBytes, '\0');
  ipc::encodeFrameHeader({ipc::kLargeFrameBodyLimit, FrameKind::largeCall, 0, 1}, bytes.data());
  std::memcpy(reader.room().first, bytes.data(), bytes.size());
  reader.received(bytes.size());
  ipc::Frame frame;
  EXPECT_EQ(reader.next(frame), ipc::FrameReader::Next::needMore);
  EXPECT_TRUE(reader.inFrame());
  EXPECT_LT(reader.room().second, 64u << 10);
}

TEST(FrameReader, ShrinksBackAfterALargeFrame) {
  ipc::FrameReader reader;
  const std::string large = ipc::makeFrame(FrameKind::call, 1, {{"text", std::string(900'000, 'x')}});
  std::memcpy(reader.room(large.size()).first, large.data(), large.size());
  reader.received(large.size());
  ipc::Frame frame;
  ASSERT_EQ(reader.next(frame), ipc::FrameReader::Next::frame);
  EXPECT_EQ(frame.body.size(), large.size() - ipc::kFrameHeaderBytes);
  EXPECT_LT(reader.room().second, 64u << 10);
}

}  // namespace
}  // namespace veltrad::ipc_test
