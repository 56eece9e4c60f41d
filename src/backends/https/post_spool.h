// SPDX-License-Identifier: Apache-2.0
// The spool: keeps posts that failed on disk, and counts what becomes of them. Any thread; files are written
// by the disk writer's thread.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <future>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "backends/https/spool_notes.h"
#include "backends/https/spool_queue.h"
#include "backends/https/spool_rules.h"
#include "base/mutex.h"
#include "http/http_client.h"
#include "platform/disk_writer.h"
#include "platform/limited_line.h"
#include "platform/memory_budget.h"
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

// Its 13 fields are the services, the parts of the spool, and who is told.
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
  // A post that was not admitted.
  void keep(const std::shared_ptr<SpooledPost>& post);

  // The sender: on its thread, but for tried().

  // Looks what an earlier daemon has left. Called once, before any post can be kept.
  void list();
  // Reads what was listed, and drops what may not leave, unless `stops` says so before.
  void load(const std::function<bool()>& stops);
  // The post as it lies there. Any thread.
  support::SpoolFolder::Read read(const Name& name) const { return _folder.read(name); }
  // Why the post may not leave. May wait for the download of a storebag, now and then.
  std::optional<wire::Reason> refusalBeforeTry(const support::SpoolEntry& post);
  // The same by what is known. Any thread.
  std::optional<wire::Reason> refusalOf(const support::SpoolEntry& post);
  // A try begins; it has ended so, on the HTTP thread, after which filed() follows on the sender's.
  void begins(const Name& name);
  void tried(const support::SpoolEntry& post, const http::HTTPResult& result);
  // Removes the file of a post that has left, or writes into it how often it was tried.
  void filed(const support::SpoolEntry& post);
  void dropExpired();

  // Removes a post and counts its events, unless it is gone. `post`: where it is at hand.
  void drop(const Name& name, wire::Reason reason, const support::SpoolEntry* post = nullptr);
  // Removes all, also what is being written, and drops what is under way if it fails. Returns how many posts.
  std::size_t empty(wire::Reason reason, Deadline deadline);
  // All of it leaves now, but for the pace. Returns how many posts that are.
  std::size_t sendNow();
  // Waits until all that was kept is on disk. False if the deadline passed first.
  bool drain(Deadline deadline);

  // Set before the sender runs.
  void setSections(SectionSource& sections) { _sections.store(&sections); }
  // Called whenever there may be something to send; null: nobody is.
  void setWaker(std::function<void()> waker);

  SpoolQueue& queue() { return _queue; }
  const SpoolRules& rules() const { return _rules; }
  const support::SpoolFolder& folder() const { return _folder; }

 private:
  void wake();
  void file(const std::shared_ptr<SpooledPost>& post);
  void write(const SpooledPost& post);
  void makeRoom();

  const platform::Clock& _clock;
  platform::Counters& _counters;
  SpoolRules _rules;
  const SpoolNotes _notes;
  const double _secondsKept;
  const support::SpoolFolder _folder;
  SpoolQueue _queue;
  platform::LimitedLine _diskLine{"posts"};
  std::atomic<SectionSource*> _sections{nullptr};
  // What an earlier daemon has left.
  std::future<std::vector<Name>> _listed;
  // When the storebags of client types were asked for. The sender's thread.
  std::map<std::int32_t, Deadline> _asked;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::function<void()> _waker GUARDED_BY(_mutex);

  // Last, because its destructor ends the writer's use of the others.
  platform::DiskWriter::Queue _jobs;
};

}  // namespace veltrad::backends
