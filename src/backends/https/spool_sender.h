// SPDX-License-Identifier: Apache-2.0
// Sends the posts of the spool again: a thread that reads what lies there, asks whether it may leave, and
// waits.
#pragma once

#include <atomic>
#include <chrono>
#include <list>
#include <memory>
#include <optional>

#include "backends/https/post_spool.h"
#include "base/file_descriptor.h"
#include "base/thread.h"
#include "platform/wake_watch.h"

namespace veltrad::backends {

// Its 15 fields are the thread, and what it remembers from one turn to the next. A turn that finds no memory
// is followed by another one.
class SpoolSender {
 public:
  // All outlive it. What an earlier daemon has left is looked at from then on.
  SpoolSender(PostSpool& spool, http::HTTPClient& http, SectionSource& sections);
  ~SpoolSender() { stop(); }

  // Reads the spool and sends from then on. False if there is no thread or descriptor just now; to be called
  // again.
  bool start();
  // Nothing more is sent after it has returned. Called again, it settles what has ended since.
  void stop();

 private:
  // A try that has ended.
  struct Ended {
    std::shared_ptr<const support::SpoolEntry> post;
    std::optional<http::HTTPResult> result = std::nullopt;
  };
  using Time = std::chrono::steady_clock::time_point;

  void wake();
  void run();
  // Returns the seconds until the next one.
  double turn();
  // Reads what an earlier daemon has left. Returns the seconds until there is more to read.
  double load();
  // Asks for all posts, if the owner's word or a storebag has changed, or some could not be decided on.
  void askAgain();
  // False: some could not be decided on.
  bool askForAll(bool withoutWaiting);
  // Drops the post if it may not leave. False: that cannot be told just now.
  bool ask(const PostSpool::Name& name, const support::SpoolEntry& post, bool withoutWaiting);
  void send(const PostSpool::Name& name);
  void begin(const PostSpool::Name& name);
  void settleEnded();
  void sayShort();
  // Until something happens, so many seconds at most.
  void wait(double seconds);

  PostSpool& _spool;
  http::HTTPClient& _http;
  FileDescriptor _news;  // constant once the thread runs
  std::atomic<bool> _stops{false};
  Thread _thread;

  // The thread only.
  platform::WakeWatch _watch;
  SpoolRules::Word _word;
  std::uint64_t _sections = 0;        // SpoolSections::turn() of the last time that all were asked for
  std::optional<ClientFacts> _facts;  // as just read
  bool _undecided = false;            // some could not be decided on
  Time _undecidedAgain = {};          // not before then
  Time _readAgain = {};
  platform::LimitedLine _shortLine{"turns"};

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::list<Ended> _ended GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
