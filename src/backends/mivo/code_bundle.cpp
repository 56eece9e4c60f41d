// SPDX-License-Identifier: Apache-2.0
// Checks who could have written the code, and loads it.
#include "backends/mivo/code_bundle.h"

#include <dlfcn.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/process_start.h"

namespace veltrad::backends {

namespace {

constexpr mode_t kWritableByOthers = S_IWGRP | S_IWOTH;
constexpr int kMostLinks = 40;

std::string loaderText(const std::string& file) {
  const char* text = ::dlerror();
  return text ? text : file + ": cannot be loaded";
}

// The mode of a link does not matter: whoever may write its directory may change it.
bool isTrusted(const struct stat& status) {
  const bool ours = status.st_uid == 0 || status.st_uid == ::geteuid();
  const bool sticky = S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0;
  return ours && ((status.st_mode & kWritableByOthers) == 0 || sticky || S_ISLNK(status.st_mode));
}

std::string reasonToDistrust(const std::string& path, const struct stat& status) {
  char facts[64];
  std::snprintf(facts, sizeof facts, ": owned by user %u, mode %04o", static_cast<unsigned>(status.st_uid),
                static_cast<unsigned>(status.st_mode & 07777));
  return path + facts +
         "; expected the file and every directory above it to be owned by root or the daemon's own user "
         "and writable by nobody else";
}

// The parts of a path in reverse order.
using Parts = std::vector<std::string>;

void putInFront(Parts& parts, const std::filesystem::path& path) {
  const Parts names(path.begin(), path.end());
  parts.insert(parts.end(), names.rbegin(), names.rend());
}

// Follows an absolute path step by step and returns the file that it leads to, or why others could have put
// code there.
Result<std::string, std::string> trustedFile(const std::filesystem::path& file) {
  Parts left;
  putInFront(left, file);
  std::filesystem::path place = "/";
  struct stat status {};
  for (int links = 0; !left.empty();) {
    const std::string name = std::move(left.back());
    left.pop_back();
    if (name.empty() || name == ".") continue;
    if (name == "..") {
      place = place.parent_path();
      continue;
    }
    const std::filesystem::path next = name == "/" ? "/" : place / name;
    if (::lstat(next.c_str(), &status) != 0) {
      return Failure{next.string() + ": " + std::generic_category().message(errno)};
    }
    if (!isTrusted(status)) return Failure{reasonToDistrust(next, status)};
    if (!S_ISLNK(status.st_mode)) {
      place = next;
      continue;
    }
    std::error_code failure;
    const std::filesystem::path target = std::filesystem::read_symlink(next, failure);
    if (failure || ++links > kMostLinks) return Failure{next.string() + ": a link that leads nowhere"};
    putInFront(left, target);
  }
  if (::lstat(place.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) {
    return Failure{place.string() + ": not a regular file"};
  }
  return place.string();
}

}  // namespace

Result<const void*, std::string> CodeBundle::object(const char* symbol) {
  const Lock held(_mutex);
  if (!_loaded) {
    const auto loaded = load();
    if (!loaded.ok()) return Failure{loaded.error()};
    _loaded = loaded.value();
  }
  const void* address = ::dlsym(_loaded, symbol);
  if (!address) return Failure{_file + ": exports no " + symbol};
  return address;
}

Result<void*, std::string> CodeBundle::load() {
  std::error_code failure;
  const auto directory = std::filesystem::canonical(_directory, failure);
  if (failure) return Failure{_file + ": " + failure.message()};
  const auto path = trustedFile(std::filesystem::absolute(_file));
  if (!path) return Failure{path.error()};
  if (!path.value().starts_with(directory.string() + "/")) {
    return Failure{_file + ": leads to " + path.value() + ", out of the bundle's directory"};
  }
  void* loaded = ::dlopen(path.value().c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!loaded) return Failure{loaderText(_file)};
  platform::renewExitGuard();
  return loaded;
}

}  // namespace veltrad::backends
