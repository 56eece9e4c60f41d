// SPDX-License-Identifier: Apache-2.0
// Gets the credentials, groups and unit of a peer from the kernel.
#include "ipc/peer.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <string_view>
#include <system_error>

#include "base/file_descriptor.h"
#include "platform/shortage.h"

namespace veltrad::ipc {

namespace {

#ifndef SO_PEERPIDFD
constexpr int SO_PEERPIDFD = 77;  // Linux 6.5
#endif

// Remembers the errno of a shortage, or 0. After a shortage it is unknown whether the peer has a unit.
struct Asked {
  int shortage = 0;
  bool failed(int error) {
    if (platform::isShortage(error)) shortage = error;
    return true;
  }
};

std::optional<std::string> contents(const std::string& path, Asked& asked) {
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file.isOpen() && asked.failed(errno)) return std::nullopt;
  std::string text;
  char buffer[4'096];
  while (text.size() < 64u << 10) {
    const ssize_t got = ::read(file.get(), buffer, sizeof buffer);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0 && asked.failed(errno)) return std::nullopt;
    if (got == 0) return text;
    text.append(buffer, static_cast<std::size_t>(got));
  }
  return std::nullopt;
}

// The rest of the first line that begins with `prefix`.
std::optional<std::string> lineAfter(std::string_view text, std::string_view prefix) {
  while (!text.empty()) {
    const auto end = text.find('\n');
    const std::string_view line = text.substr(0, end);
    if (line.substr(0, prefix.size()) == prefix) return std::string(line.substr(prefix.size()));
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  }
  return std::nullopt;
}

// The process of a pidfd; 0 if it is dead (-1) or in another process namespace (0).
int processOfPidfd(int pidfd, Asked& asked) {
  const auto information = contents("/proc/self/fdinfo/" + std::to_string(pidfd), asked);
  const auto text = information ? lineAfter(*information, "Pid:\t") : std::nullopt;
  int pid = 0;
  if (text) std::from_chars(text->data(), text->data() + text->size(), pid);
  return pid > 0 ? pid : 0;
}

FileDescriptor pidfdOfPeer(int socket, Asked& asked) {
  int pidfd = -1;
  socklen_t length = sizeof pidfd;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &pidfd, &length) != 0 && asked.failed(errno)) return {};
  return FileDescriptor(pidfd);
}

std::optional<std::string> unitOfPeer(int socket, Asked& asked) {
  const FileDescriptor pidfd = pidfdOfPeer(socket, asked);
  if (!pidfd.isOpen()) return std::nullopt;
  const int pid = processOfPidfd(pidfd.get(), asked);
  if (pid == 0) return std::nullopt;
  const auto groups = contents("/proc/" + std::to_string(pid) + "/cgroup", asked);
  // If the process is still alive, the number was its own when the groups were read.
  if (!groups || processOfPidfd(pidfd.get(), asked) != pid) return std::nullopt;
  auto path = lineAfter(*groups, "0::");
  for (std::string_view left = *groups; !path && !left.empty();) {  // cgroup v1: "N:name=systemd:/path"
    const auto end = left.find('\n');
    const std::string_view line = left.substr(0, end);
    static constexpr std::string_view kHierarchy = ":name=systemd:";
    const auto place = line.find(kHierarchy);
    if (place != std::string_view::npos) path = std::string(line.substr(place + kHierarchy.size()));
    left.remove_prefix(end == std::string_view::npos ? left.size() : end + 1);
  }
  return path ? systemUnitOfControlGroup(*path) : std::nullopt;
}

// The error is an errno.
Result<std::vector<unsigned>, int> supplementaryGroups(int socket) {
  std::vector<unsigned> groups(64);
  while (true) {
    auto length = static_cast<socklen_t>(groups.size() * sizeof(unsigned));
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length) == 0) {
      groups.resize(length / sizeof(unsigned));
      return groups;
    }
    if (errno != ERANGE || length / sizeof(unsigned) <= groups.size()) return Failure{errno};
    groups.resize(length / sizeof(unsigned));
  }
}

bool endsWith(std::string_view text, std::string_view end) {
  return text.size() > end.size() && text.substr(text.size() - end.size()) == end;
}

}  // namespace

bool isOwner(unsigned uid) {
  return uid == 0 || uid == ::geteuid();
}

Result<Peer, std::string> credentialsOfSocket(int socket) {
  ucred credentials{};
  socklen_t length = sizeof credentials;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) {
    return Failure{"the peer's credentials: " + std::generic_category().message(errno)};
  }
  Peer peer;
  peer.uid = credentials.uid;
  peer.gids.push_back(credentials.gid);
  peer.pid = credentials.pid;
  return peer;
}

Result<Peer, std::string> peerOfSocket(int socket) {
  auto credentials = credentialsOfSocket(socket);
  if (!credentials) return credentials;
  const auto groups = supplementaryGroups(socket);
  if (!groups) return Failure{"the peer's groups: " + std::generic_category().message(groups.error())};

  Peer& peer = credentials.value();
  peer.gids.insert(peer.gids.end(), groups.value().begin(), groups.value().end());
  Asked asked;
  peer.unit = unitOfPeer(socket, asked);
  if (asked.shortage != 0)
    return Failure{"the peer's unit: " + std::generic_category().message(asked.shortage)};
  return credentials;
}

bool kernelTellsUnits() {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return platform::isShortage(errno);
  const FileDescriptor one(ends[0]);
  const FileDescriptor other(ends[1]);
  Asked asked;
  return pidfdOfPeer(one.get(), asked).isOpen() || asked.shortage != 0;
}

// A unit lies below its slices. Names below the unit are chosen by the unit itself and are not trusted.
std::optional<std::string> systemUnitOfControlGroup(const std::string& path) {
  std::string_view left = path;
  bool first = true;
  while (!left.empty() && left.front() == '/') {
    left.remove_prefix(1);
    const std::string_view name = left.substr(0, left.find('/'));
    left.remove_prefix(name.size());
    if (first && name == "user.slice") return std::nullopt;
    first = false;
    if (endsWith(name, ".slice")) continue;
    for (const char* kind : {".service", ".scope", ".socket", ".mount", ".swap"}) {
      if (endsWith(name, kind)) return std::string(name);
    }
    return std::nullopt;
  }
  return std::nullopt;
}

}  // namespace veltrad::ipc
