// Opening and removing a file by its directory. See the header for who does it.
#include "client/uploaded_file.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

#include "base/text.h"

namespace veltrad {

namespace {

constexpr off_t kMostBytes = 0x7fffffff;  // what the daemon takes

std::string absolute(const std::string& path) {
  if (!path.empty() && path.front() == '/') return path;
  char* current = ::getcwd(nullptr, 0);
  const std::string whole = current ? std::string(current) + '/' + path : path;
  ::free(current);
  return whole;
}

const char* kindOfFile(mode_t mode) {
  if (S_ISLNK(mode)) return "a symbolic link";
  if (S_ISDIR(mode)) return "a directory";
  if (S_ISFIFO(mode)) return "a FIFO";
  if (S_ISSOCK(mode)) return "a socket";
  return "a device";
}

}  // namespace

UploadedFile::UploadedFile(const std::string& path) : _absolutePath(absolute(path)) {
  const std::size_t slash = path.rfind('/');
  _name = slash == std::string::npos ? path : path.substr(slash + 1);
  const std::string directory = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  _directory.reset(::open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (_directory.isOpen()) {
    open();
  } else {
    _problem = failed("cannot be opened", errno);
  }
}

void UploadedFile::open() {
  if (::fstatat(_directory.get(), _name.c_str(), &_facts, AT_SYMLINK_NOFOLLOW) != 0) {
    _problem = failed("cannot be opened", errno);
    return;
  }
  // Before it is opened: a FIFO's writer would see a reader, and a device may do what its name promises.
  if (S_ISREG(_facts.st_mode)) {
    _file.reset(
        ::openat(_directory.get(), _name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!_file.isOpen() || ::fstat(_file.get(), &_facts) != 0) {
      _problem = failed("cannot be opened", errno);
      _file.reset();
      return;
    }
  }
  const std::string shown = escapedForLog(_absolutePath);
  if (!S_ISREG(_facts.st_mode)) {
    _problem = fmt::format("{} is {}: expected a regular file.", shown, kindOfFile(_facts.st_mode));
  } else if (_facts.st_size == 0) {
    _problem = fmt::format("{} is empty.", shown);
  } else if (_facts.st_size > kMostBytes) {
    _problem = fmt::format("{} has {} bytes: at most {} are uploaded.", shown, _facts.st_size, kMostBytes);
  }
}

std::optional<std::string> UploadedFile::remove() const {
  struct stat now {};
  if (::fstatat(_directory.get(), _name.c_str(), &now, AT_SYMLINK_NOFOLLOW) != 0) {
    return failed("is stored, but cannot be found any more", errno);
  }
  if (!S_ISREG(now.st_mode) || now.st_dev != _facts.st_dev || now.st_ino != _facts.st_ino) {
    return fmt::format("{} is stored, but another file has taken its place, which stays.",
                       escapedForLog(_absolutePath));
  }
  if (::unlinkat(_directory.get(), _name.c_str(), 0) != 0) {
    return failed("is stored, but cannot be removed", errno);
  }
  return std::nullopt;
}

std::string UploadedFile::failed(const char* what, int error) const {
  return fmt::format("{} {}: {}.", escapedForLog(_absolutePath), what,
                     std::error_code(error, std::generic_category()).message());
}

}  // namespace veltrad
