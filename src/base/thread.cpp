// SPDX-License-Identifier: Apache-2.0
// A pthread with its own stack size.
#include "base/thread.h"

#include <signal.h>

#include <cstdlib>
#include <memory>
#include <new>
#include <utility>

namespace veltrad {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define VELTRA_LARGE_FRAMES 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define VELTRA_LARGE_FRAMES 1
#endif
#endif

#ifdef VELTRA_LARGE_FRAMES
const std::size_t kConnectionStackBytes = 2u << 20;
#else
const std::size_t kConnectionStackBytes = 256u << 10;
#endif

namespace {

struct Start {
  const char* name;
  std::function<void()> body;
};

void* run(void* argument) {
  const std::unique_ptr<Start> start(static_cast<Start*>(argument));
  pthread_setname_np(pthread_self(), start->name);
  start->body();
  return nullptr;
}

}  // namespace

Thread::Thread(Thread&& other) noexcept
    : _thread(other._thread), _running(std::exchange(other._running, false)) {}

Thread& Thread::operator=(Thread&& other) noexcept {
  if (_running) std::abort();
  _thread = other._thread;
  _running = std::exchange(other._running, false);
  return *this;
}

bool Thread::start(const char* name, std::size_t stackBytes, std::function<void()> body) {
  std::unique_ptr<Start> start(new (std::nothrow) Start{name, std::move(body)});
  pthread_attr_t attributes;
  if (!start || pthread_attr_init(&attributes) != 0) return false;
  pthread_attr_setstacksize(&attributes, stackBytes);
  // The new thread inherits the mask: signals belong to the main thread.
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &before);
  _running = pthread_create(&_thread, &attributes, run, start.get()) == 0;
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  pthread_attr_destroy(&attributes);
  if (_running) (void)start.release();  // The new thread owns it.
  return _running;
}

void Thread::join() {
  if (std::exchange(_running, false)) pthread_join(_thread, nullptr);
}

}  // namespace veltrad
