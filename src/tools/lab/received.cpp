// SPDX-License-Identifier: Apache-2.0
// Appends arrivals to the file and keeps the newest lines.
#include "received.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "base/text.h"
#include "formats/json.h"

namespace veltrad::lab {
namespace {
constexpr std::size_t kNewestLines = 50;
constexpr std::size_t kNewestBytes = 4096;
}  // namespace

double secondsNow() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

Received::Received(std::string path) : _path(std::move(path)) {
  _file.reset(::open(_path.c_str(), O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
  struct stat status {};
  if (!ok() || ::fstat(_file.get(), &status) != 0) return;
  _firstByte = static_cast<std::uint64_t>(status.st_size);
  const Lock hold(_mutex);
  _endByte = _firstByte;
}

void Received::add(const Dictionary& arrival, std::string_view body) {
  std::string line = formats::writeJSON(arrival);
  if (!body.empty()) {
    line.pop_back();
    line.append(",\"body\":").append(body).push_back('}');
  }
  line.push_back('\n');
  const Lock hold(_mutex);
  const ssize_t written = ::write(_file.get(), line.data(), line.size());
  if (written != static_cast<ssize_t>(line.size())) {
    std::fprintf(stderr, "%s: could not be appended to: %s\n", _path.c_str(),
                 written < 0 ? std::strerror(errno) : "the disk is full");
    return;
  }
  _endByte += line.size();
  line.resize(std::min(line.size() - 1, kNewestBytes));
  _newest.push_front(std::move(line));
  if (_newest.size() > kNewestLines) _newest.pop_back();
  ++_count;
  _changed.notifyAll();
}

std::uint64_t Received::waitFor(std::uint64_t count, std::chrono::milliseconds time) {
  const auto until = std::chrono::steady_clock::now() + time;
  const Lock hold(_mutex);
  while (!_stopped && _count < count && std::chrono::steady_clock::now() < until)
    _changed.waitUntil(_mutex, until);
  return _count;
}

void Received::stop() {
  const Lock hold(_mutex);
  _stopped = true;
  _changed.notifyAll();
}

std::uint64_t Received::endByte() const {
  const Lock hold(_mutex);
  return _endByte;
}

std::string Received::read(std::uint64_t offset, std::size_t most) const {
  std::string bytes(most, '\0');
  const ssize_t got = ::pread(_file.get(), bytes.data(), most, static_cast<off_t>(offset));
  bytes.resize(got > 0 ? static_cast<std::size_t>(got) : 0);
  return bytes;
}

std::deque<std::string> Received::newest() const {
  const Lock hold(_mutex);
  return _newest;
}

std::string bodyAsJSON(const std::string& body) {
  if (body.empty()) return {};
  if (const auto parsed = formats::parseJSON(body)) {
    // Unchanged, so that numbers keep their form.
    return body.find_first_of("\r\n") == std::string::npos ? body : formats::writeJSON(parsed.value());
  }
  return formats::writeJSON(isUTF8(body) ? Value(body) : Value(Data{body}));
}

}  // namespace veltrad::lab
