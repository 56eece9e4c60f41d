// SPDX-License-Identifier: Apache-2.0
// Measures what the parts of a message's road cost when nothing is around them. Prints one JSON object.
// Usage: floors BODY URL CA LEVEL DATAGRAM-BYTES (BODY: a file with the JSON of a post; CPU microseconds, of
// the
//        post too for each of its events)
//        floors posts BODY URL CA LEVEL IN-FLIGHT SECONDS (posts a second)
#include <arpa/inet.h>
#include <curl/curl.h>
#include <fmt/format.h>
#include <netinet/in.h>
#include <rapidjson/document.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>
#include <zlib.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <iterator>
#include <string>
#include <thread>
#include <vector>

#include "message.h"
#include "plain_list.h"
#include "wire/constants.h"
#include "wire/frame.h"
#include "wire/names.h"

namespace {

constexpr double kLeastMicroseconds = 100'000;  // each part runs at least as long
constexpr int kFrames = 50'000;
constexpr int kPosts = 200;
constexpr int kGzipWindowBits = 15 + 16;
constexpr int kMemoryLevel = 8;

[[noreturn]] void fail(const std::string& text) {
  std::fprintf(stderr, "floors: %s\n", text.c_str());
  std::exit(1);
}

double cpuMicroseconds(clockid_t clock) {
  timespec time{};
  clock_gettime(clock, &time);
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

double microsecondsOf(const std::function<void()>& one) {
  for (int i = 0; i < 100; ++i) one();
  const double begin = cpuMicroseconds(CLOCK_THREAD_CPUTIME_ID);
  double took = 0;
  int times = 0;
  while (took < kLeastMicroseconds) {
    for (int i = 0; i < 100; ++i) one();
    times += 100;
    took = cpuMicroseconds(CLOCK_THREAD_CPUTIME_ID) - begin;
  }
  return took / times;
}

// The frame in which the library sends the message.
std::string messageFrame() {
  namespace wire = veltrad::wire;
  using veltrad::Dictionary;
  Dictionary payload;
  for (int i = 0; i < bench::kTexts; ++i) payload.set(bench::keyOfText(i), bench::textOf(i));
  payload.set("seconds", bench::kSeconds);
  payload.set("count", bench::kCount);
  Dictionary message{{wire::kVeltraMessageParametersCategory, static_cast<unsigned>(bench::kCategory)},
                     {wire::kVeltraMessageParametersType, static_cast<unsigned>(bench::kType)}};
  message.set(wire::kVeltraMessageParametersPayload, std::move(payload));
  Dictionary body{{wire::key::kOperation, wire::operation::kSendMessage}};
  body.set(wire::key::kArguments, std::move(message));
  return wire::makeFrame(wire::FrameKind::call, 1, std::move(body));
}

// CPU of a thread that takes frames from a Unix socket, which another thread writes one by one.
double frameFloor(const std::string& frame) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) fail("no socket pair");
  std::thread writer([&] {
    for (int i = 0; i < kFrames; ++i) {
      if (write(ends[0], frame.data(), frame.size()) < 0) fail("the socket pair broke");
    }
    shutdown(ends[0], SHUT_WR);
  });
  std::vector<char> room(64u << 10);
  std::size_t have = 0;
  int taken = 0;
  const double begin = cpuMicroseconds(CLOCK_THREAD_CPUTIME_ID);
  for (;;) {
    const ssize_t got = read(ends[1], room.data() + have, room.size() - have);
    if (got <= 0) break;
    have += static_cast<std::size_t>(got);
    std::size_t at = 0;
    while (have - at >= veltrad::wire::kFrameHeaderBytes) {
      const auto header = veltrad::wire::decodeFrameHeader(room.data() + at);
      const std::size_t whole = veltrad::wire::kFrameHeaderBytes + header.bodyLength;
      if (have - at < whole) break;
      at += whole;
      ++taken;
    }
    std::memmove(room.data(), room.data() + at, have - at);
    have -= at;
  }
  const double took = cpuMicroseconds(CLOCK_THREAD_CPUTIME_ID) - begin;
  writer.join();
  close(ends[0]);
  close(ends[1]);
  if (taken != kFrames) fail("frames were lost");
  return took / kFrames;
}

double datagramFloor(std::size_t size) {
  const int server = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  const int client = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof address;
  auto* plain = reinterpret_cast<sockaddr*>(&address);
  if (bind(server, plain, length) != 0 || getsockname(server, plain, &length) != 0 ||
      connect(client, plain, sizeof address) != 0) {
    fail("no datagram sockets");
  }
  std::thread drain([server] {
    char room[2048];
    while (recv(server, room, sizeof room, 0) > 0) {
    }
  });
  const std::string bytes(size, 'x');
  const double took =
      microsecondsOf([&] { static_cast<void>(send(client, bytes.data(), bytes.size(), MSG_DONTWAIT)); });
  shutdown(server, SHUT_RDWR);
  drain.join();
  close(server);
  close(client);
  return took;
}

double propertyListFloor(const std::string& frame) {
  const std::string body = frame.substr(veltrad::wire::kFrameHeaderBytes);
  return microsecondsOf([&] {
    if (bench::PlainList(body).objects() == 0) fail("the plain reader cannot read the frame");
  });
}

double jsonFloor(const rapidjson::Document& document) {
  rapidjson::StringBuffer buffer;
  return microsecondsOf([&] {
    buffer.Clear();
    rapidjson::Writer writer(buffer);
    document.Accept(writer);
  });
}

std::string compressed(z_stream& stream, const std::string& body) {
  deflateReset(&stream);
  std::string room(deflateBound(&stream, body.size()), '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(body.data()));
  stream.avail_in = static_cast<uInt>(body.size());
  stream.next_out = reinterpret_cast<Bytef*>(room.data());
  stream.avail_out = static_cast<uInt>(room.size());
  if (deflate(&stream, Z_FINISH) != Z_STREAM_END) fail("zlib failed");
  room.resize(stream.total_out);
  return room;
}

std::size_t discard(char*, std::size_t size, std::size_t count, void*) {
  return size * count;
}

struct Target {
  std::string url;
  std::string certificates;
  std::string body;
  bool gzip;
};

CURL* handleFor(const Target& target, curl_slist* headers) {
  CURL* handle = curl_easy_init();
  curl_easy_setopt(handle, CURLOPT_URL, target.url.c_str());
  curl_easy_setopt(handle, CURLOPT_CAINFO, target.certificates.c_str());
  curl_easy_setopt(handle, CURLOPT_POSTFIELDS, target.body.data());
  curl_easy_setopt(handle, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(target.body.size()));
  curl_easy_setopt(handle, CURLOPT_HTTPHEADER, headers);
  curl_easy_setopt(handle, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
  curl_easy_setopt(handle, CURLOPT_WRITEFUNCTION, discard);
  curl_easy_setopt(handle, CURLOPT_NOSIGNAL, 1L);
  return handle;
}

curl_slist* headersFor(const Target& target) {
  curl_slist* headers = curl_slist_append(nullptr, "Content-Type: application/json");
  headers = curl_slist_append(headers, "Accept: application/json");
  headers = curl_slist_append(headers, "Expect:");
  if (target.gzip) headers = curl_slist_append(headers, "Content-Encoding: gzip");
  return headers;
}

void checkAnswer(CURL* handle, CURLcode result) {
  long status = 0;
  curl_easy_getinfo(handle, CURLINFO_RESPONSE_CODE, &status);
  if (result != CURLE_OK || status != 200)
    fail(fmt::format("a post failed: {}, HTTP {}", curl_easy_strerror(result), status));
}

// CPU of a post on a connection that stands.
double postFloor(const Target& target) {
  curl_slist* headers = headersFor(target);
  CURL* handle = handleFor(target, headers);
  checkAnswer(handle, curl_easy_perform(handle));
  const double begin = cpuMicroseconds(CLOCK_PROCESS_CPUTIME_ID);
  for (int i = 0; i < kPosts; ++i) checkAnswer(handle, curl_easy_perform(handle));
  const double took = cpuMicroseconds(CLOCK_PROCESS_CPUTIME_ID) - begin;
  curl_easy_cleanup(handle);
  curl_slist_free_all(headers);
  return took / kPosts;
}

// Posts a second with so many under way at once.
double postsASecond(const Target& target, int inFlight, double seconds) {
  using Clock = std::chrono::steady_clock;
  curl_slist* headers = headersFor(target);
  CURLM* multi = curl_multi_init();
  std::vector<CURL*> handles;
  for (int i = 0; i < inFlight; ++i) {
    handles.push_back(handleFor(target, headers));
    curl_multi_add_handle(multi, handles.back());
  }
  int done = 0;
  const auto begin = Clock::now();
  double took = 0;
  while (took < seconds) {
    int running = 0;
    curl_multi_perform(multi, &running);
    int left = 0;
    while (const CURLMsg* message = curl_multi_info_read(multi, &left)) {
      CURL* handle = message->easy_handle;
      checkAnswer(handle, message->data.result);
      ++done;
      curl_multi_remove_handle(multi, handle);
      curl_multi_add_handle(multi, handle);
    }
    curl_multi_poll(multi, nullptr, 0, 100, nullptr);
    took = std::chrono::duration<double>(Clock::now() - begin).count();
  }
  for (CURL* handle : handles) {
    curl_multi_remove_handle(multi, handle);
    curl_easy_cleanup(handle);
  }
  curl_multi_cleanup(multi);
  curl_slist_free_all(headers);
  return done / took;
}

}  // namespace

int main(int count, char** arguments) {
  const bool posts = count > 1 && std::string(arguments[1]) == "posts";
  if (count != (posts ? 8 : 6))
    fail("usage: floors [posts] BODY URL CA LEVEL (DATAGRAM-BYTES | IN-FLIGHT SECONDS)");
  char** const given = arguments + (posts ? 2 : 1);
  std::ifstream file(given[0], std::ios::binary);
  const std::string body{std::istreambuf_iterator<char>(file), {}};
  rapidjson::Document document;
  if (document.Parse(body.data(), body.size()).HasParseError() || !document.HasMember("events"))
    fail("the body is no post");
  const double events = document["events"].Size();
  const int level = std::atoi(given[3]);
  z_stream stream{};
  if (deflateInit2(&stream, level, Z_DEFLATED, kGzipWindowBits, kMemoryLevel, Z_DEFAULT_STRATEGY) != Z_OK)
    fail("zlib failed");
  const Target target{given[1], given[2], level > 0 ? compressed(stream, body) : body, level > 0};
  curl_global_init(CURL_GLOBAL_DEFAULT);
  if (posts) {
    fmt::print("{{\"postsASecond\": {:.1f}}}\n",
               postsASecond(target, std::atoi(given[4]), std::atof(given[5])));
    return 0;
  }
  const std::string frame = messageFrame();
  const double zlib = level > 0 ? microsecondsOf([&] { compressed(stream, body); }) / events : 0;
  fmt::print(
      "{{\"frame\": {:.3f}, \"list\": {:.3f}, \"json\": {:.3f}, \"zlib\": {:.3f}, \"post\": {:.3f}, "
      "\"datagram\": "
      "{:.3f}, \"frameBytes\": {}, \"bodyBytes\": {}, \"postedBytes\": {}, \"events\": {}}}\n",
      frameFloor(frame), propertyListFloor(frame), jsonFloor(document) / events, zlib,
      postFloor(target) / events, datagramFloor(std::strtoul(given[4], nullptr, 10)), frame.size(),
      body.size(), target.body.size(), events);
  deflateEnd(&stream);
  curl_global_cleanup();
  return 0;
}
