// SPDX-License-Identifier: Apache-2.0
// The spool: keeps posts that failed on disk, and counts what becomes of them. Any thread; files are written
// by the disk writer's thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/https/spool_backlog.h"
#include "backends/https/spool_notes.h"
#include "backends/https/spool_queue.h"
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

// A post on its way, which becomes a file if it fails.
struct SpooledPost {
  support::SpoolEntry entry;
  // Pays for it until it is on disk or has ended.
  platform::Charge charge = {};
  // Its number in the record of fates; 0: none.
  std::uint64_t fate = 0;
  // As in SpoolQueue::Admission.
  std::uint64_t emptied = 0;
};

// "spool" in settings.json, and where it lies.
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

// Its 15 fields are the services, the parts of the spool, and who is told.
class PostSpool {
 public:
  using Name = support::SpoolFolder::Name;
  using Deadline = std::chrono::steady_clock::time_point;

  // What it takes outlives it.
  PostSpool(const SpoolServices& services, SpoolSettings settings);

  // New posts: on a session's thread, and on the HTTP thread when they have ended.

  // Numbers the post. Why it has to be kept without being sent, as one line; nothing: it is under way until
  // ended().
  std::optional<std::string> admit(SpooledPost& post);
  // If it has ended so that it is kept, that is done soon.
  void ended(const std::shared_ptr<SpooledPost>& post, const http::HTTPResult& result);
  // Keeps a post that was not admitted.
  void keep(const std::shared_ptr<SpooledPost>& post);

  // The sender's thread, where nothing else is said.

  // Has what an earlier daemon has left looked at, unless that was done. Any thread; first called before any
  // post can be kept.
  void list();
  // Reads some of it, and gives each post that is kept to `each`. Returns the seconds until there may be more
  // to read; nothing: all was read.
  using Each = std::function<void(const Name& name, const support::SpoolEntry& post)>;
  std::optional<double> loadSome(const Each& each);
  // The same for what could not be read then.
  void readAgain(const Each& each);
  // The post as it lies there. Any thread.
  support::SpoolFolder::Read read(const Name& name) const { return _folder.read(name); }
  // Whether the post may leave by what is known of its storebag. Any thread.
  LeaveVerdict verdict(const support::SpoolEntry& post, const std::optional<ClientFacts>& facts) const;
  // The same, but that it waits while its storebag is being fetched, which this may begin.
  LeaveVerdict verdictBeforeTry(const support::SpoolEntry& post, const std::optional<ClientFacts>& facts);
  // A try begins; it has ended so, and the file is removed, or is told how often the post was tried.
  void begins(const Name& name);
  void tried(const support::SpoolEntry& post, const http::HTTPResult& result);
  // Of a post that was dropped after so many tries; without any there is no record.
  void recordUnsent(const support::SpoolEntry& post, int tries) const;
  void dropExpired();

  // Removes a post and counts its events. False: it is gone. `post`: where it is at hand.
  bool drop(const Name& name, wire::Reason reason, const support::SpoolEntry* post = nullptr);
  // Removes all, also what was not read yet and what is being written, and drops what is under way if it
  // fails. Returns how many posts.
  std::size_t empty(wire::Reason reason, Deadline deadline);
  // All of it leaves now, but for the pace. Returns how many posts that are.
  std::size_t sendNow();
  // Waits until all that was kept is on disk. False if the deadline passed first.
  bool drain(Deadline deadline);

  // Called whenever there may be something to send; null: nobody is.
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
  const SpoolNotes _notes;
  support::SpoolAge _age;
  const support::SpoolFolder _folder;
  SpoolRemovals _removals;
  SpoolQueue _queue;
  SpoolSections _sections;
  SpoolBacklog _backlog;
  platform::LimitedLine _diskLine{"posts"};

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::function<void()> _waker GUARDED_BY(_mutex);
  // Why what is listed later is dropped: the spool was emptied before it was known what there is.
  std::optional<wire::Reason> _unlisted GUARDED_BY(_mutex);

  // Last, because its destructor ends the writer's use of the others.
  platform::DiskWriter::Queue _jobs;
};

}  // namespace veltrad::backends
