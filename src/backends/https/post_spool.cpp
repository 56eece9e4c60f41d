// SPDX-License-Identifier: Apache-2.0
// Files, reads and drops posts.
#include "backends/https/post_spool.h"

#include <time.h>

#include <algorithm>
#include <new>
#include <utility>

#include "backends/https/post_request.h"
#include "backends/https/spool_verdicts.h"
#include "config/owner_gate.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad::backends {

using State = support::SpoolPlace::State;
using wire::Reason;

namespace {

// Their memory is charged to their users; this is for those without an account.
constexpr std::size_t kMostWaitingBytes = 256u << 20;

http::DepartureEnd endOf(const http::HTTPResult& result) {
  http::DepartureEnd end;
  end.status = result ? result.value().status : result.error().status;
  if (!result) end.error = result.error().description;
  return end;
}

// A clock that continues while the machine sleeps and is never set.
double runningSeconds() {
  timespec time{};
  ::clock_gettime(CLOCK_BOOTTIME, &time);
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

support::SpoolPlace placeOf(const support::SpoolEntry& entry, std::uint64_t fate) {
  support::SpoolPlace place;
  place.name = {entry.order, entry.id};
  place.events = entry.events;
  place.connection = entry.connection;
  place.fate = static_cast<std::uint32_t>(fate);
  place.tries = entry.tries;
  place.backend = wire::numberOfBackend(entry.text("backend"));
  return place;
}

}  // namespace

PostSpool::PostSpool(const SpoolServices& services, SpoolSettings settings)
    : _clock(services.clock),
      _counters(services.counters),
      _rules(services.rules),
      _notes(services.rules.gate, services.fates),
      _age(settings.days * 86'400),
      _folder(services.files, std::move(settings.directory)),
      _removals(_folder, services.counters),
      _queue(services.clock, settings.bounds, settings.pace),
      _jobs(services.writer, kMostWaitingBytes) {}

void PostSpool::setWaker(std::function<void()> waker) {
  const Lock held(_mutex);
  _waker = std::move(waker);
}

void PostSpool::wake() {
  const Lock held(_mutex);
  if (_waker) _waker();
}

std::optional<std::string> PostSpool::admit(SpooledPost& post) {
  auto admission = _queue.admit(std::string(http::addressOf(post.entry.url)), post.entry.connection);
  post.entry.order = admission.order;
  post.emptied = admission.emptied;
  return std::move(admission.refusal);
}

void PostSpool::ended(const std::shared_ptr<SpooledPost>& post, const http::HTTPResult& result) {
  support::SpoolEntry& entry = post->entry;
  const std::string address(http::addressOf(entry.url));
  entry.tries = static_cast<std::uint16_t>(triesOf(result));
  if (isToBeKept(result)) {
    entry.lastError = outcomeOf(result);
    if (tellsOfServer(result)) _queue.failed(address, result);
    return keep(post);
  }
  if (entry.tries > 0) _notes.record(entry, entry.tries, endOf(result));
  _queue.landed(entry.order, address, result.ok());
  // Others may have waited for it.
  if (_queue.amount().posts > 0) wake();
}

void PostSpool::keep(const std::shared_ptr<SpooledPost>& post) {
  const support::SpoolEntry& entry = post->entry;
  if (!_queue.add(placeOf(entry, post->fate), std::string(http::addressOf(entry.url)), entry.uid,
                  post->emptied)) {
    _counters.count(Reason::spool_refused_by_owner, entry.events);
    _notes.dropped(placeOf(entry, post->fate), Reason::refused_by_owner);
    return recordUnsent(entry, entry.tries);
  }
  using Put = platform::DiskWriter::Queue::Put;
  const std::size_t bytes = entry.body.size() + entry.url.size();
  const auto job = [this, post] {
    try {
      // Recorded here if it was dropped meanwhile, because the dropping thread had no copy.
      if (!keepOnDisk(post->entry)) recordUnsent(post->entry, post->entry.tries);
    } catch (const std::bad_alloc&) {
      drop({post->entry.order, post->entry.id}, Reason::spool_disk, &post->entry);
    }
  };
  if (_jobs.put(job, bytes) != Put::taken) drop({entry.order, entry.id}, Reason::spool_disk, &entry);
}

// On the disk writer's thread. False: somebody else has dropped it.
bool PostSpool::keepOnDisk(const support::SpoolEntry& entry) {
  const Name name{entry.order, entry.id};
  if (const auto refused = verdict(entry, _rules.facts()).refusal) return drop(name, *refused, &entry);
  const std::string bytes = support::writeSpoolEntry(entry);
  if (!_queue.setBytes(name.order, static_cast<std::uint32_t>(bytes.size()))) return false;
  makeRoom();
  if (!_queue.holds(name.order)) return false;  // it was the oldest of those that take too much
  if (const auto written = _folder.write(name, bytes); !written) {
    const auto line = _diskLine.happened("A post could not be kept: " + written.error());
    if (line) logError("%s", line->c_str());
    const bool dropped = drop(name, Reason::spool_disk, &entry);
    _removals.remove(name);  // it may be there, and its name not on disk
    return dropped;
  }
  const auto place = _queue.written(name.order);
  if (!place) {
    _removals.remove(name);
    return false;
  }
  _counters.count(Reason::kept_in_spool, entry.events);
  _notes.kept(*place, entry.lastError, _queue.waitAt(place->address));
  wake();
  return true;
}

void PostSpool::makeRoom() {
  auto why = support::SpoolIndex::Excess::full;
  while (const auto name = _queue.excess(why))
    drop(*name, why == support::SpoolIndex::Excess::share ? Reason::spool_share : Reason::spool_full);
}

bool PostSpool::drop(const Name& name, Reason reason, const support::SpoolEntry* post) {
  const auto place = _queue.takeOut(name.order);
  if (!place) return false;
  if (place->state == State::unread) {
    dropUnread(name, reason);
    return true;
  }
  const bool onDisk = place->state != State::writing;
  // Kept events were settled before.
  if (onDisk) _counters.eventTaken(place->events);
  _counters.count(countedFromSpool(reason), place->events);
  _notes.dropped(*place, reason);
  // The thread that writes or sends the post has a copy and records it.
  const bool records = place->tries > 0 && _notes.keepsRecords() &&
                       (place->state == State::waiting || (place->state == State::writing && post));
  const auto kept = records && !post ? read(name).entry : std::nullopt;
  if (onDisk) _removals.remove(name);
  if (kept) post = &*kept;
  if (records && post) recordUnsent(*post, place->tries);
  return true;
}

void PostSpool::dropUnread(const Name& name, Reason reason) {
  const support::SpoolFolder::Read found = read(name);
  if (found.torn) _counters.count(Reason::spool_torn);
  if (found.entry) {
    _counters.eventTaken(found.entry->events);
    _counters.count(countedFromSpool(reason), found.entry->events);
  }
  _removals.remove(name);
  if (found.entry) recordUnsent(*found.entry, found.entry->tries);
}

void PostSpool::recordUnsent(const support::SpoolEntry& post, int tries) const {
  if (tries == 0) return;
  http::DepartureEnd end;
  end.error = post.lastError;
  try {
    _notes.record(post, tries, end);
  } catch (const std::bad_alloc&) {
    logWarning("A post that was dropped from the spool is not in the history: no memory");
  }
}

std::size_t PostSpool::empty(Reason reason, Deadline deadline) {
  list();
  const auto unread = _backlog.takeAll(deadline);
  if (!unread) dropUnlisted(reason);
  const auto names = _queue.empty();
  for (const Name& name : names) drop(name, reason);
  for (const Name& name : unread.value_or(std::vector<Name>())) dropUnread(name, reason);
  // Posts that were being written remove their own files.
  static_cast<void>(drain(deadline));
  return names.size() + (unread ? unread->size() : 0);
}

std::size_t PostSpool::sendNow() {
  const std::size_t posts = _queue.hurry();
  wake();
  return posts;
}

bool PostSpool::drain(Deadline deadline) {
  return _jobs.run([] {}, deadline);
}

// By the disk writer, so that nothing is written meanwhile.
void PostSpool::list() {
  if (!_backlog.isToBeListed()) return;
  const auto job = [this] {
    try {
      _backlog.listed(_folder.names(platform::timevalToSeconds(_clock.now())));
    } catch (const std::bad_alloc&) {
      _backlog.listed(std::nullopt);
    }
    wake();
  };
  if (_jobs.put(job, 1) != platform::DiskWriter::Queue::Put::taken) _backlog.listed(std::nullopt);
}

std::optional<double> PostSpool::loadSome(const Each& each) {
  constexpr std::chrono::milliseconds kTurn{100};
  constexpr double kUntilItIsListed = 0.3;
  if (_queue.isLoaded()) return std::nullopt;
  list();
  const auto until = std::chrono::steady_clock::now() + kTurn;
  while (const auto name = _backlog.next()) {
    try {
      const auto why = whyUnlisted();
      if (why) dropUnread(*name, *why);
      // It may have been kept since, and listed for that.
      if (!why && !_queue.holds(name->order)) load(*name, each);
    } catch (const std::bad_alloc&) {
      _backlog.wasRead(false);
      throw;
    }
    _backlog.wasRead(true);
    if (std::chrono::steady_clock::now() >= until) return 0;
  }
  if (!_backlog.isDone()) return kUntilItIsListed;
  dropUnlisted(std::nullopt);
  _queue.allLoaded();
  makeRoom();
  return std::nullopt;
}

void PostSpool::dropUnlisted(std::optional<Reason> why) {
  const Lock held(_mutex);
  _unlisted = why;
}

std::optional<Reason> PostSpool::whyUnlisted() {
  const Lock held(_mutex);
  return _unlisted;
}

void PostSpool::load(const Name& name, const Each& each) {
  const support::SpoolFolder::Read found = read(name);
  const auto& entry = found.entry;
  const auto bytes = static_cast<std::uint32_t>(found.bytes);
  if (found.torn) {
    _counters.count(Reason::spool_torn);
    logWarning("A post in the spool is torn, and removed: %s", support::textOf(name.id).c_str());
    _removals.remove(name);
  }
  if (found.passes && !_queue.holds(name.order)) _queue.addUnread(name, bytes);
  if (!entry && !found.passes) static_cast<void>(_queue.takeOut(name.order));
  if (!entry) return;
  support::SpoolPlace place = placeOf(*entry, 0);
  place.bytes = bytes;
  _queue.addLoaded(place, std::string(http::addressOf(entry->url)), entry->uid, entry->lastError);
  each(name, *entry);
}

void PostSpool::readAgain(const Each& each) {
  for (const Name& name : _queue.unread()) load(name, each);
}

LeaveVerdict PostSpool::verdict(const support::SpoolEntry& post,
                                const std::optional<ClientFacts>& facts) const {
  const auto section = post.asksEntry ? _sections.known(post.clientType()) : nullptr;
  return _rules.verdict(post, section.get(), facts);
}

LeaveVerdict PostSpool::verdictBeforeTry(const support::SpoolEntry& post,
                                         const std::optional<ClientFacts>& facts) {
  const bool asksSection = post.asksEntry && !post.namesHidden;
  if (!asksSection || !_sections.isAwaited(post.clientType())) return verdict(post, facts);
  const auto refused = _rules.ownersRefusal(post);
  return {refused, !refused};
}

void PostSpool::begins(const Name& name) {
  if (const auto place = _queue.place(name.order)) _notes.again(*place);
}

// If a kill leaves the file of a delivered post, the post is sent again with the same ID.
void PostSpool::tried(const support::SpoolEntry& post, const http::HTTPResult& result) {
  const Name name{post.order, post.id};
  const int tries = post.tries + triesOf(result);
  const bool refused = !result && result.error().kind == http::HTTPError::Kind::refused;
  if (refused) drop(name, result.error().refusal.value_or(Reason::refused_by_owner), &post);
  const auto place = refused ? std::nullopt : _queue.tried(post.order, result);
  if (!place) {  // dropped, now or meanwhile
    if (tries > 0) _notes.record(post, tries, endOf(result));
    return;
  }
  if (!result || isToBeKept(result)) {
    _notes.kept(*place, outcomeOf(result), _queue.waitAt(place->address));
    return writeAgain(post);
  }
  const int status = result.value().status;
  const Reason reason = verdictOfStatus(status).reason;
  _counters.eventTaken(post.events);
  _counters.count(reason, post.events);
  _removals.remove(name);
  _notes.answered(*place, reason, status);
  _notes.record(post, tries, endOf(result));
}

// With the number of its tries.
void PostSpool::writeAgain(const support::SpoolEntry& post) {
  const Name name{post.order, post.id};
  if (const auto place = _queue.place(post.order)) {
    support::SpoolEntry now = post;
    now.tries = place->tries;
    now.lastError = _queue.statusAt(place->address).lastError;
    const std::string bytes = support::writeSpoolEntry(now);
    if (_folder.write(name, bytes)) _queue.setBytes(name.order, static_cast<std::uint32_t>(bytes.size()));
  }
  // It may have been dropped meanwhile.
  if (!_queue.holds(post.order)) _removals.remove(name);
}

void PostSpool::dropExpired() {
  const auto amount = _queue.amount();
  if (amount.posts == 0) return;
  const double now = platform::timevalToSeconds(_clock.now());
  const std::uint64_t last = _age.tooOldBefore(now, runningSeconds(), amount.oldest, _queue.lastOrder());
  while (const auto name = _queue.olderThan(last)) drop(*name, Reason::spool_expired);
}

}  // namespace veltrad::backends
