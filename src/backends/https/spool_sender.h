// SPDX-License-Identifier: Apache-2.0
// Sends the posts of the spool again: a thread that reads them, checks whether they may leave, and waits.
#pragma once

#include <atomic>
#include <chrono>
#include <list>
#include <memory>
#include <optional>

#include "backends/https/post_spool.h"
#include "base/file_descriptor.h"
#include "base/thread.h"
#include "platform/network_watch.h"

namespace veltrad::backends {

// Its 15 fields are the thread and its state between two turns. A turn that fails for lack of memory is
// repeated.
class SpoolSender {
 public:
  // All must outlive it. Lists the posts of an earlier daemon.
  SpoolSender(PostSpool& spool, http::HTTPClient& http, SectionSource& sections);
  ~SpoolSender() { stop(); }

  // Reads the spool and sends from then on. False if there is no thread or descriptor at the moment; to be
  // called again.
  bool start();
  // Nothing is sent after it has returned. A further call settles the posts that have ended since.
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
  // Checks all posts again if the owner's decision or a storebag has changed, or if some were undecided.
  void askAgain();
  // False if some posts remain undecided.
  bool askForAll(bool withoutWaiting);
  // Drops the post if it may not leave. False if this is undecided.
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
  platform::NetworkWatch _watch;
  SpoolRules::OwnerState _owner;
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
