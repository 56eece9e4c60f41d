// SPDX-License-Identifier: Apache-2.0
// Files, reads and drops posts.
#include "backends/https/post_spool.h"

#include <new>

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

NotedPost notedPost(const support::SpoolPlace& place) {
  return {place.backend, place.fate};
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
      _secondsKept(settings.days * 86'400),
      _folder(services.files, std::move(settings.directory)),
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
  auto admission = _queue.admit(http::addressOf(post.entry.url), post.entry.connection);
  post.entry.order = admission.order;
  post.emptied = admission.emptied;
  return std::move(admission.refusal);
}

void PostSpool::ended(const std::shared_ptr<SpooledPost>& post, const http::HTTPResult& result) {
  support::SpoolEntry& entry = post->entry;
  const std::string address = http::addressOf(entry.url);
  // One that the day's limit refused has begun, but not left.
  if (result || (result.error().begun && result.error().refusal != Reason::over_daily_limit)) ++entry.tries;
  if (isToBeKept(result)) {
    entry.lastError = outcomeOf(result);
    _queue.failed(address, result);
    return file(post);
  }
  if (entry.tries > 0) _notes.record(entry, entry.tries, endOf(result));
  _queue.landed(entry.order, address, result.ok());
  // Others may have waited for it.
  if (_queue.amount().posts > 0) wake();
}

void PostSpool::keep(const std::shared_ptr<SpooledPost>& post) {
  file(post);
}

void PostSpool::file(const std::shared_ptr<SpooledPost>& post) {
  const support::SpoolEntry& entry = post->entry;
  if (!_queue.add(placeOf(entry, post->fate), http::addressOf(entry.url), entry.uid, post->emptied)) {
    _counters.count(Reason::spool_refused_by_owner, entry.events);
    return _notes.dropped(notedPost(placeOf(entry, post->fate)), Reason::refused_by_owner);
  }
  using Put = platform::DiskWriter::Queue::Put;
  const std::size_t bytes = entry.body.size() + entry.url.size();
  const auto job = [this, post] {
    try {
      write(*post);
    } catch (const std::bad_alloc&) {
      drop({post->entry.order, post->entry.id}, Reason::spool_disk, &post->entry);
    }
  };
  if (_jobs.put(job, bytes) != Put::taken) drop({entry.order, entry.id}, Reason::spool_disk, &entry);
}

// On the disk writer's thread.
void PostSpool::write(const SpooledPost& post) {
  const support::SpoolEntry& entry = post.entry;
  const Name name{entry.order, entry.id};
  if (const auto refused = refusalOf(entry)) return drop(name, *refused, &entry);
  const std::string bytes = support::writeSpoolEntry(entry);
  if (!_queue.setBytes(name.order, static_cast<std::uint32_t>(bytes.size()))) return;  // emptied
  makeRoom();
  if (!_queue.holds(name.order)) return;  // it was the oldest of those that take too much
  const auto written = _folder.write(name, bytes);
  if (!written) {
    const auto line = _diskLine.happened("A post could not be kept: " + written.error());
    if (line) logError("%s", line->c_str());
    return drop(name, Reason::spool_disk, &entry);
  }
  if (!_queue.written(name.order)) return _folder.remove(name);  // emptied
  _counters.count(Reason::kept_in_spool, entry.events);
  SpoolQueue::AddressStatus address;
  const auto place = _queue.place(name.order, address);
  if (place) _notes.kept(notedPost(*place), entry.lastError, _queue.waitAt(place->address));
  wake();
}

void PostSpool::makeRoom() {
  auto why = support::SpoolIndex::Excess::full;
  while (const auto name = _queue.excess(why))
    drop(*name, why == support::SpoolIndex::Excess::share ? Reason::spool_share : Reason::spool_full);
}

void PostSpool::drop(const Name& name, Reason reason, const support::SpoolEntry* post) {
  const auto place = _queue.takeOut(name.order);
  if (!place) return;
  const bool onDisk = place->state != State::writing;
  // What was kept has been settled before.
  if (onDisk) _counters.eventTaken(place->events);
  _counters.count(countedFromSpool(reason), place->events);
  _notes.dropped(notedPost(*place), reason);
  if (place->tries > 0 && _notes.keepsRecords()) {
    const auto kept = post || !onDisk ? std::nullopt : read(name).entry;
    if (!post && kept) post = &*kept;
    http::DepartureEnd end;
    if (post) end.error = post->lastError;
    if (post) _notes.record(*post, place->tries, end);
  }
  if (onDisk) _folder.remove(name);
}

std::size_t PostSpool::empty(Reason reason, Deadline deadline) {
  static_cast<void>(_queue.waitUntilLoaded(deadline));
  const auto names = _queue.empty();
  for (const Name& name : names) drop(name, reason);
  // What was being written removes itself.
  static_cast<void>(drain(deadline));
  return names.size();
}

std::size_t PostSpool::sendNow() {
  const std::size_t posts = _queue.hurry();
  wake();
  return posts;
}

bool PostSpool::drain(Deadline deadline) {
  const auto done = std::make_shared<std::promise<void>>();
  auto written = done->get_future();
  using Put = platform::DiskWriter::Queue::Put;
  return _jobs.put([done] { done->set_value(); }, 1) == Put::taken &&
         written.wait_until(deadline) == std::future_status::ready;
}

// By the disk writer, so that nothing is written meanwhile.
void PostSpool::list() {
  const auto listed = std::make_shared<std::promise<std::vector<Name>>>();
  _listed = listed->get_future();
  using Put = platform::DiskWriter::Queue::Put;
  const auto put = _jobs.put([this, listed] { listed->set_value(_folder.names()); }, 1);
  if (put != Put::taken) listed->set_value({});
}

void PostSpool::load(const std::function<bool()>& stops) {
  for (const Name& name : _listed.get()) {
    if (stops()) return;
    const support::SpoolFolder::Read found = read(name);
    const auto& entry = found.entry;
    if (found.torn) {
      _counters.count(Reason::spool_torn);
      logWarning("A post in the spool is torn, and removed: %s", support::textOf(name.id).c_str());
      _folder.remove(name);
    }
    if (!entry) continue;
    support::SpoolPlace place = placeOf(*entry, 0);
    place.bytes = static_cast<std::uint32_t>(found.bytes);
    if (!_queue.addLoaded(place, http::addressOf(entry->url), entry->uid, entry->lastError)) {
      _folder.remove(name);
    } else if (const auto refused = refusalBeforeTry(*entry)) {
      drop(name, *refused, &*entry);
    }
  }
  _queue.allLoaded();
  makeRoom();
}

std::optional<Reason> PostSpool::refusalOf(const support::SpoolEntry& post) {
  return _rules.refusal(post, _sections.load(), false);
}

// Each question is a log line where a storebag cannot be had.
std::optional<Reason> PostSpool::refusalBeforeTry(const support::SpoolEntry& post) {
  constexpr std::chrono::seconds kApart{30};
  const auto now = std::chrono::steady_clock::now();
  const auto [asked, isNew] = _asked.try_emplace(post.clientType(), now);
  const bool fetch = isNew || asked->second + kApart <= now;
  if (fetch) asked->second = now;
  return _rules.refusal(post, _sections.load(), fetch);
}

void PostSpool::begins(const Name& name) {
  SpoolQueue::AddressStatus address;
  if (const auto place = _queue.place(name.order, address)) _notes.again(notedPost(*place));
}

void PostSpool::tried(const support::SpoolEntry& post, const http::HTTPResult& result) {
  if (!result && result.error().kind == http::HTTPError::Kind::refused) {
    const Reason why = result.error().refusal.value_or(Reason::refused_by_owner);
    return drop({post.order, post.id}, why, &post);
  }
  const auto place = _queue.tried(post.order, result);
  if (!place) return;
  if (!result || isToBeKept(result))
    return _notes.kept(notedPost(*place), outcomeOf(result), _queue.waitAt(place->address));
  const int status = result.value().status;
  const Reason reason = verdictOfStatus(status).reason;
  _counters.eventTaken(post.events);
  _counters.count(reason, post.events);
  _notes.answered(notedPost(*place), reason, status);
  _notes.record(post, place->tries, endOf(result));
}

// A post that has arrived and whose file outlives a kill comes again with the same ID.
void PostSpool::filed(const support::SpoolEntry& post) {
  const Name name{post.order, post.id};
  SpoolQueue::AddressStatus address;
  if (const auto place = _queue.place(post.order, address)) {
    support::SpoolEntry now = post;
    now.tries = place->tries;
    now.lastError = address.lastError;
    const std::string bytes = support::writeSpoolEntry(now);
    if (_folder.rewrite(name, bytes)) _queue.setBytes(name.order, static_cast<std::uint32_t>(bytes.size()));
  }
  // It may have been dropped meanwhile.
  if (!_queue.holds(post.order)) _folder.remove(name);
}

void PostSpool::dropExpired() {
  const double last = platform::timevalToSeconds(_clock.now()) - _secondsKept;
  if (last <= 0) return;
  while (const auto name = _queue.olderThan(static_cast<std::uint64_t>(last * 1e6)))
    drop(*name, Reason::spool_expired);
}

}  // namespace veltrad::backends
