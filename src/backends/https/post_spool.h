// SPDX-License-Identifier: Apache-2.0
// The spool: keeps failed posts on disk, and counts their results. Any thread; files are written by the disk
// writer's thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/https/spool_backlog.h"
#include "backends/https/spool_queue.h"
#include "backends/https/spool_recorder.h"
#include "backends/https/spool_removals.h"
#include "backends/https/spool_rules.h"
#include "backends/https/spool_sections.h"
#include "base/mutex.h"
#include "http/http_client.h"
#include "platform/disk_writer.h"
#include "platform/limited_line.h"
#include "platform/memory_budget.h"
#include "support/spool_age.h"
#include "support/spool_entry.h"
#include "support/spool_folder.h"

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::backends {

// An open post, which becomes a file if it fails.
struct SpooledPost {
  support::SpoolEntry entry;
  // Pays for it until it is on disk or has ended.
  platform::Charge charge = {};
  // Its number in the record of fates; 0: none.
  std::uint64_t fate = 0;
  // As in SpoolQueue::Admission.
  std::uint64_t emptied = 0;
};

// "spool" in settings.json, and its directory.
struct SpoolSettings {
  std::string directory;
  support::SpoolBounds bounds;
  double days = 7;
  SpoolPace pace;
};

struct SpoolServices {
  const platform::Clock& clock;
  platform::Counters& counters;
  platform::FileStore& files;
  platform::DiskWriter& writer;
  SpoolRules::Sources rules;
  // May be null.
  platform::FateRing* fates = nullptr;
};

// Its 15 fields are the services, the parts of the spool, and the waker.
class PostSpool {
 public:
  using Name = support::SpoolFolder::Name;
  using Deadline = std::chrono::steady_clock::time_point;

  // The constructor's arguments must outlive it.
  PostSpool(const SpoolServices& services, SpoolSettings settings);

  // New posts: on a session's thread, and on the HTTP thread when they have ended.

  // Numbers the post. Returns why it must be kept without being sent, as one line; absent if it may be sent,
  // until ended().
  std::optional<std::string> admit(SpooledPost& post);
  // Ends an open post; keeps it soon if the result requires that.
  void ended(const std::shared_ptr<SpooledPost>& post, const http::HTTPResult& result);
  // Keeps a post that was not admitted.
  void keep(const std::shared_ptr<SpooledPost>& post);

  // The sender's thread, unless stated otherwise.

  // Lists the files of an earlier daemon, unless that was done. Any thread; first called before any post can
  // be kept.
  void list();
  // Reads some of these files, and passes each kept post to `each`. Returns the seconds until there may be
  // more to read; absent if all were read.
  using Each = std::function<void(const Name& name, const support::SpoolEntry& post)>;
  std::optional<double> loadSome(const Each& each);
  // The same for files that could not be read then.
  void readAgain(const Each& each);
  // Reads the post's file. Any thread.
  support::SpoolFolder::Read read(const Name& name) const { return _folder.read(name); }
  // Whether the post may leave, by the known section of its storebag. Any thread.
  LeaveVerdict verdict(const support::SpoolEntry& post, const std::optional<ClientFacts>& facts) const;
  // The same, but the post waits while its storebag is fetched; may start the fetch.
  LeaveVerdict verdictBeforeTry(const support::SpoolEntry& post, const std::optional<ClientFacts>& facts);
  // A try begins; a try has ended, and the file is removed or updated with the number of tries.
  void begins(const Name& name);
  void tried(const support::SpoolEntry& post, const http::HTTPResult& result);
  // Records a post that was dropped after so many tries; without a try there is no record.
  void recordUnsent(const support::SpoolEntry& post, int tries) const;
  void dropExpired();

  // Removes a post and counts its events. False: it is gone. `post`: where it is at hand.
  bool drop(const Name& name, wire::Reason reason, const support::SpoolEntry* post = nullptr);
  // Removes all posts, also those not read yet and those being written, and drops open posts if they fail.
  // Returns the number of posts.
  std::size_t empty(wire::Reason reason, Deadline deadline);
  // Makes all posts due now, limited only by the pace. Returns the number of posts.
  std::size_t sendNow();
  // Waits until all that was kept is on disk. False if the deadline passed first.
  bool drain(Deadline deadline);

  // Sets the function that is called whenever there may be something to send; may be null.
  void setWaker(std::function<void()> waker);

  SpoolQueue& queue() { return _queue; }
  SpoolSections& sections() { return _sections; }
  SpoolRemovals& removals() { return _removals; }
  const SpoolRules& rules() const { return _rules; }
  const support::SpoolFolder& folder() const { return _folder; }

 private:
  void wake();
  void dropUnlisted(std::optional<wire::Reason> why);
  std::optional<wire::Reason> whyUnlisted();
  bool keepOnDisk(const support::SpoolEntry& entry);
  void makeRoom();
  void load(const Name& name, const Each& each);
  void dropUnread(const Name& name, wire::Reason reason);
  void writeAgain(const support::SpoolEntry& post);

  const platform::Clock& _clock;
  platform::Counters& _counters;
  SpoolRules _rules;
  const SpoolRecorder _notes;
  support::SpoolAge _age;
  const support::SpoolFolder _folder;
  SpoolRemovals _removals;
  SpoolQueue _queue;
  SpoolSections _sections;
  SpoolBacklog _backlog;
  platform::LimitedLine _diskLine{"posts"};

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::function<void()> _waker GUARDED_BY(_mutex);
  // Why files that are listed later are dropped: the spool was emptied before its files were listed.
  std::optional<wire::Reason> _unlisted GUARDED_BY(_mutex);

  // Last, because its destructor ends the writer's use of the others.
  platform::DiskWriter::Queue _jobs;
};

}  // namespace veltrad::backends
