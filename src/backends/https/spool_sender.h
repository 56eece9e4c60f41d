// SPDX-License-Identifier: Apache-2.0
// Sends the posts of the spool again: a thread that reads what lies there, asks whether it may leave, and
// waits.
#pragma once

#include <atomic>
#include <memory>
#include <vector>

#include "backends/https/post_spool.h"
#include "base/file_descriptor.h"
#include "base/thread.h"
#include "platform/wake_watch.h"

namespace veltrad::backends {

class SpoolSender {
 public:
  // Both outlive it.
  SpoolSender(PostSpool& spool, http::HTTPClient& http);
  ~SpoolSender() { stop(); }

  // Reads the spool and sends from then on. False if there is no thread or descriptor.
  bool start(SectionSource& sections);
  // Nothing more is sent after it has returned.
  void stop();

 private:
  void wake();
  void run();
  // Drops what may not leave any more, if the owner's word has changed.
  void askAgain();
  void send(const PostSpool::Name& name);
  void fileEnded();
  // Until something happens, so many seconds at most.
  void wait(double seconds);

  PostSpool& _spool;
  http::HTTPClient& _http;
  const FileDescriptor _news;
  std::atomic<bool> _stops{false};
  Thread _thread;

  // The thread only.
  platform::WakeWatch _watch;
  SpoolRules::Word _word;

  // Tries that have ended.
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::vector<std::shared_ptr<const support::SpoolEntry>> _ended GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
