// SPDX-License-Identifier: Apache-2.0
// Files on their way out: descriptors among waiting frames, and removal for those who ask for no answer.
#include <fstream>

#include "client/out_frames.h"
#include "harness.h"
#include "ipc/socket_reader.h"

namespace veltrad::client_test {
namespace {

std::string fileIn(const std::string& directory, const char* name) {
  std::string path = directory + "/" + name;
  std::ofstream(path) << name;
  return path;
}

TEST(Upload, DescriptorsThatWaitTravelWithTheirFrames) {
  TemporaryDirectory directory;
  const auto file = [&](const char* name) {
    return std::make_shared<client::UploadedFile>(fileIn(directory.path(), name));
  };
  int ends[2];
  ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
  const FileDescriptor out(ends[0]), in(ends[1]);
  client::SentRecord record;
  client::OutFrames frames(1u << 20, record);
  frames.connect(out.get(), {});
  frames.release();
  std::uint32_t queued = 0;
  const auto put = [&](const std::shared_ptr<client::UploadedFile>& lent) {
    const Dictionary body{{"bulk", Data{std::string(30'000, 'b')}}};
    frames.write({wire::makeFrame(wire::FrameKind::call, ++queued, body, lent ? 1 : 0), lent});
  };
  put(file("1"));  // goes at once
  while (frames.empty()) put(nullptr);
  const std::uint32_t waiting = queued;
  put(file("2"));
  put(file("3"));
  put(nullptr);
  put(file("4"));

  ipc::SocketReader reader(nullptr);
  std::string lent;
  wire::Frame frame;
  for (std::uint32_t read = 0; read < queued;) {
    frames.writeWaiting();
    ASSERT_EQ(reader.receive(in.get()), ipc::SocketReader::Got::bytes);
    while (reader.next(frame) == wire::FrameReader::Next::frame) {
      EXPECT_EQ(frame.header.callID, ++read);
      if (frame.header.descriptors == 0) continue;
      const auto descriptor = reader.takeDescriptor();
      char name = '?';
      EXPECT_TRUE(descriptor && ::pread(descriptor->get(), &name, 1, 0) == 1);
      lent += std::to_string(read > waiting ? read - waiting : 0) + ":" + name + " ";
    }
  }
  EXPECT_EQ(lent, "0:1 1:2 2:3 4:4 ");
  EXPECT_FALSE(reader.strayDescriptors());
}

TEST(Upload, RemovesForThoseWhoAskForNoAnswerAndOnlyWhatTheCallLent) {
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.callID == 0) return;
    const std::string path = *call.args().string("path");
    const std::uint32_t named = path.ends_with("kept") ? call.callID + 1 : call.callID;
    link.send(
        wire::makeFrame(wire::FrameKind::event, 0,
                        {{"op", wire::event::kRemoveUploadedFile}, {"args", Dictionary{{"call", named}}}}));
    link.send(replyFrame(call.callID, {{"uploaded", true}}));
  });
  veltra::Session session = open(daemon);
  const Handle plain = openHandle(daemon);
  const std::string kept = fileIn(daemon.root.directory(), "kept");
  const std::string silent = fileIn(daemon.root.directory(), "silent");
  const veltra::Reply reply = session.uploadFile(kept).get();
  EXPECT_TRUE(reply.uploaded && !reply.removed && !reply.error && std::filesystem::exists(kept));
  EXPECT_EQ(veltra_session_upload_file(plain.get(), silent.c_str(), nullptr, nullptr), VELTRA_OK);
  EXPECT_EQ(veltra_session_upload_file(plain.get(), nullptr, nullptr, nullptr), VELTRA_INVALID);
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (std::filesystem::exists(silent)) {
    ASSERT_LT(std::chrono::steady_clock::now(), deadline);
    std::this_thread::yield();
  }
}

}  // namespace
}  // namespace veltrad::client_test
