// SPDX-License-Identifier: Apache-2.0
// A code bundle: a directory with a file NAME.so that is loaded at first use. Any thread.
#pragma once

#include <string>

#include "base/mutex.h"
#include "base/result.h"

namespace veltrad::backends {

// Loads only code that nobody but root and the process's own user could have put there. The file, every link
// on the way to it, and every directory above either end of a link must be owned by one of the two. The file
// and the directories must not be writable by others, except directories with the sticky bit such as /tmp.
// Links must not lead out of the bundle's directory. Loaded code is never unloaded.
class CodeBundle {
 public:
  CodeBundle(const std::string& directory, const std::string& name)
      : _directory(directory), _file(directory + "/" + name + ".so") {}

  const std::string& file() const { return _file; }
  // Returns the address of an object that the file exports. The error names the file and what is wrong. After
  // a failure the next call tries to load the file again.
  Result<const void*, std::string> object(const char* symbol);

 private:
  Result<void*, std::string> load() REQUIRES(_mutex);

  const std::string _directory;
  const std::string _file;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  void* _loaded GUARDED_BY(_mutex) = nullptr;
};

}  // namespace veltrad::backends
