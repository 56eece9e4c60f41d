// Code loaded with dlopen, once it is clear whose it is. Any thread.
#include "platform/code_bundle.h"

#include <dlfcn.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>

namespace veltrad::platform {

namespace {

constexpr mode_t kWritableByOthers = S_IWGRP | S_IWOTH;

std::string loaderText(const std::string& file) {
  const char* text = ::dlerror();
  return text ? text : file + ": cannot be loaded";
}

bool isTrusted(const struct stat& status) {
  const bool ours = status.st_uid == 0 || status.st_uid == ::geteuid();
  const bool sticky = S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0;
  return ours && ((status.st_mode & kWritableByOthers) == 0 || sticky);
}

// Nothing, or why somebody else could have put code there. `path` is absolute and free of links.
std::optional<std::string> distrust(const std::string& path) {
  struct stat status {};
  for (std::size_t end = 0; end != std::string::npos;) {
    end = path.find('/', end + 1);
    const std::string part = path.substr(0, end);
    if (::lstat(part.c_str(), &status) != 0) return part + ": " + std::generic_category().message(errno);
    if (isTrusted(status)) continue;
    char facts[64];
    std::snprintf(facts, sizeof facts, ": owned by user %u, mode %04o", static_cast<unsigned>(status.st_uid),
                  static_cast<unsigned>(status.st_mode & 07777));
    return part + facts +
           "; expected the file and every directory above it to be owned by root or the daemon's own user "
           "and writable by nobody else";
  }
  return S_ISREG(status.st_mode) ? std::nullopt : std::optional(path + ": not a regular file");
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
  const std::string path = std::filesystem::canonical(_file, failure).string();
  if (failure) return Failure{_file + ": " + failure.message()};
  if (auto reason = distrust(path)) return Failure{std::move(*reason)};
  void* loaded = ::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!loaded) return Failure{loaderText(_file)};
  return loaded;
}

}  // namespace veltrad::platform
