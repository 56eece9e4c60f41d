// SPDX-License-Identifier: Apache-2.0
// The loop of the spool's thread.
#include "backends/https/spool_sender.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <new>
#include <utility>

#include "platform/log.h"

namespace veltrad::backends {

namespace {

// How often the owner's decision and the age of posts are checked while the spool is not empty.
constexpr double kLook = 0.3;
constexpr double kIdle = 3600;
// Until a post is tried again whose file or facts cannot be read, or whose storebag is being fetched.
constexpr double kUntilDecided = 0.1;
// Between two attempts at all that could not be read, or decided on.
constexpr std::chrono::seconds kApart{1};
constexpr std::size_t kStackBytes = 256u << 10;
// The number of names that are taken out of the queue at once.
constexpr std::size_t kSome = 256;

http::HTTPRequest requestOf(const std::shared_ptr<const support::SpoolEntry>& post) {
  http::HTTPRequest request;
  request.method = http::HTTPRequest::Method::post;
  request.lane = http::HTTPRequest::Lane::event;
  request.url = post->url;
  request.headers = post->headers;
  request.sharedBody = std::shared_ptr<const std::string>(post, &post->body);
  request.isKept = true;
  request.again = post->tries > 0;
  request.events = post->events;
  request.client = std::make_shared<const Dictionary>(post->client);
  request.about = post->about;
  request.keepsAnswer = false;
  return request;
}

}  // namespace

SpoolSender::SpoolSender(PostSpool& spool, http::HTTPClient& http, SectionSource& sections)
    : _spool(spool), _http(http) {
  _spool.sections().setSource(sections, [this] { wake(); });
  _spool.list();
}

bool SpoolSender::start() {
  if (_thread.running()) return true;
  if (!_news.isOpen()) _news.reset(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!_news.isOpen()) return false;
  _spool.setWaker([this] { wake(); });
  return _thread.start("spool", std::max(kStackBytes, kConnectionStackBytes), [this] { run(); });
}

void SpoolSender::stop() {
  _stops = true;
  _spool.queue().stopSending();
  if (_thread.running()) wake();
  _thread.join();
  _spool.sections().stop();
  _spool.setWaker(nullptr);
  try {
    settleEnded();
  } catch (const std::bad_alloc&) {
    logWarning("Posts that have ended stay in the spool: no memory");
  }
}

void SpoolSender::wake() {
  ::eventfd_write(_news.get(), 1);  // fails only if it is awake
}

void SpoolSender::run() {
  _owner = _spool.rules().ownerState({});
  while (!_stops) {
    double next = kLook;
    try {
      next = turn();
    } catch (const std::bad_alloc&) {
      sayShort();
    }
    wait(next);
    if (_watch.happened()) _spool.queue().woken();
  }
}

void SpoolSender::sayShort() {
  try {
    const auto line = _shortLine.happened("The spool goes on a little later: no memory");
    if (line) logWarning("%s", line->c_str());
  } catch (const std::bad_alloc&) {  // said the next time
  }
}

double SpoolSender::turn() {
  settleEnded();
  const bool removesAgain = _spool.removals().tryAgain();
  const double loads = load();
  const bool holds = _spool.queue().amount().posts > 0;
  if (holds) askAgain();
  _spool.dropExpired();
  double next = kIdle;
  for (const PostSpool::Name& name : _spool.queue().takeDue(next)) send(name);
  return std::min({loads, next, holds || removesAgain ? kLook : kIdle});
}

double SpoolSender::load() {
  const auto now = std::chrono::steady_clock::now();
  const bool isTime = _readAgain <= now;
  if (isTime) _readAgain = now + kApart;
  const bool readsAgain = isTime && !_spool.queue().unread().empty();
  if (_spool.queue().isLoaded() && !readsAgain) return kIdle;
  _facts = _spool.rules().facts();
  const auto each = [this](const PostSpool::Name& name, const support::SpoolEntry& post) {
    const bool before = std::exchange(_undecided, true);  // also if there is no memory to ask with
    _undecided = !ask(name, post, false) || before;
  };
  if (readsAgain) _spool.readAgain(each);
  return _spool.loadSome(each).value_or(kIdle);
}

void SpoolSender::askAgain() {
  const SpoolRules::OwnerState owner = _spool.rules().ownerState(_owner);
  const std::uint64_t sections = _spool.sections().turn();
  const auto now = std::chrono::steady_clock::now();
  const bool again = _undecided && _undecidedAgain <= now;
  if (owner == _owner && sections == _sections && !again) return;
  // Consent that is withdrawn does not wait for a storebag that might override it.
  const bool withdrawn = _owner.consent && !owner.consent;
  _owner = owner;
  _sections = sections;
  _facts = _spool.rules().facts();
  _undecidedAgain = now + kApart;
  _undecided = true;  // also if there is no memory to ask with
  _undecided = !askForAll(withdrawn);
}

bool SpoolSender::askForAll(bool withoutWaiting) {
  const auto all = _spool.rules().refusalOfAll();
  bool decided = true;
  std::uint64_t after = 0;
  for (auto names = _spool.queue().names(after, kSome); !names.empty() && !_stops;
       names = _spool.queue().names(after, kSome)) {
    if (_spool.rules().ownerState(_owner) != _owner) return false;  // all begins again
    for (const PostSpool::Name& name : names) {
      after = name.order;
      if (all) {
        _spool.drop(name, *all);
        continue;
      }
      const support::SpoolFolder::Read found = _spool.read(name);
      decided = decided && !found.passes;
      if (found.entry) decided = ask(name, *found.entry, withoutWaiting) && decided;
    }
  }
  return decided;
}

bool SpoolSender::ask(const PostSpool::Name& name, const support::SpoolEntry& post, bool withoutWaiting) {
  const LeaveVerdict verdict =
      withoutWaiting ? _spool.verdict(post, _facts) : _spool.verdictBeforeTry(post, _facts);
  if (verdict.refusal) _spool.drop(name, *verdict.refusal, &post);
  return !verdict.waits;
}

void SpoolSender::send(const PostSpool::Name& name) {
  try {
    begin(name);
  } catch (const std::bad_alloc&) {
    _spool.queue().putBack(name.order, kLook);
    sayShort();
  }
}

void SpoolSender::begin(const PostSpool::Name& name) {
  SpoolQueue& queue = _spool.queue();
  support::SpoolFolder::Read found = _spool.read(name);
  if (found.passes) return queue.putBack(name.order, kUntilDecided);
  const auto place = queue.place(name.order);
  if (!place) return;
  if (!found.entry) return static_cast<void>(_spool.drop(name, wire::Reason::spool_disk));
  found.entry->tries = place->tries;
  const auto post = std::make_shared<const support::SpoolEntry>(std::move(*found.entry));
  _facts = _spool.rules().facts();
  const LeaveVerdict verdict = _spool.verdictBeforeTry(*post, _facts);
  if (!verdict.mayLeave()) queue.putBack(name.order, verdict.waits ? kUntilDecided : 0);
  if (verdict.refusal) _spool.drop(name, *verdict.refusal, post.get());
  if (!verdict.mayLeave()) return;
  // It may have been dropped since it was taken out of the queue.
  if (!queue.holds(name.order)) return _spool.recordUnsent(*post, post->tries);
  // Made before the end, for which there may be no memory.
  const auto node = std::make_shared<std::list<Ended>>(1, Ended{post});
  const auto ended = [this, node](http::HTTPResult result) {
    {
      const Lock held(_mutex);
      node->front().result = std::move(result);
      _ended.splice(_ended.end(), *node);
    }
    wake();
  };
  _spool.begins(name);
  if (const auto started = _http.start(requestOf(post), ended); !started) ended(Failure{started.error()});
}

void SpoolSender::settleEnded() {
  for (;;) {
    std::list<Ended> one;
    {
      const Lock held(_mutex);
      if (_ended.empty()) return;
      one.splice(one.end(), _ended, _ended.begin());
    }
    try {
      _spool.tried(*one.front().post, *one.front().result);
    } catch (const std::bad_alloc&) {
      const Lock held(_mutex);
      _ended.splice(_ended.begin(), one);
      throw;
    }
  }
}

void SpoolSender::wait(double seconds) {
  std::array<pollfd, 2> events{{{_news.get(), POLLIN, 0}, {_watch.descriptor(), POLLIN, 0}}};
  const double whole = std::floor(std::max(0.0, seconds));
  const timespec most{static_cast<time_t>(whole), static_cast<long>((std::max(0.0, seconds) - whole) * 1e9)};
  ::ppoll(events.data(), events.size(), &most, nullptr);
  eventfd_t count = 0;
  ::eventfd_read(_news.get(), &count);  // fails if the time is over
}

}  // namespace veltrad::backends
