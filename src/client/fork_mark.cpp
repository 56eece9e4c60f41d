// SPDX-License-Identifier: Apache-2.0
// A private page with MADV_WIPEONFORK.
#include "client/fork_mark.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>

namespace veltrad::client {

namespace {
std::size_t pageBytes() {
  return static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
}
}  // namespace

ForkMark::ForkMark() : _process(::getpid()) {
  void* page = ::mmap(nullptr, pageBytes(), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) return;
  if (::madvise(page, pageBytes(), MADV_WIPEONFORK) != 0) {
    ::munmap(page, pageBytes());
    return;
  }
  *static_cast<char*>(page) = 1;
  _page = static_cast<const char*>(page);
}

ForkMark::~ForkMark() {
  if (_page) ::munmap(const_cast<char*>(_page), pageBytes());
}

bool ForkMark::forked() const {
  return _page ? *_page == 0 : ::getpid() != _process;
}

}  // namespace veltrad::client
