// A code bundle: a directory that holds NAME.so, loaded into the process at first use. Any thread.
#pragma once

#include <string>

#include "base/mutex.h"
#include "base/result.h"

namespace veltrad::backends {

// Only code that nobody but root and the process's own user could have put there is loaded: the file, every
// link on the way to it, and every directory above either end of a link must belong to one of the two, and
// files and directories be writable by nobody else (a directory with the sticky bit, /tmp, by others). Links
// must not lead out of the bundle's directory. What was loaded stays for the life of the process.
class CodeBundle {
 public:
  CodeBundle(const std::string& directory, const std::string& name)
      : _directory(directory), _file(directory + "/" + name + ".so") {}

  const std::string& file() const { return _file; }
  // The address of an object that the file exports. The error names the file and what is wrong; a file that
  // could not be loaded is tried again at the next call.
  Result<const void*, std::string> object(const char* symbol);

 private:
  Result<void*, std::string> load() REQUIRES(_mutex);

  // Constant after construction.
  const std::string _directory;
  const std::string _file;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  void* _loaded GUARDED_BY(_mutex) = nullptr;  // dlopen's handle
};

}  // namespace veltrad::backends
