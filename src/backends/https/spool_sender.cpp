// SPDX-License-Identifier: Apache-2.0
// The loop of the spool's thread.
#include "backends/https/spool_sender.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>

#include "backends/https/spool_verdicts.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {

// How often the owner's word and the age of posts are looked at while the spool holds anything.
constexpr double kLook = 0.3;
constexpr std::size_t kStackBytes = 256u << 10;
// Names that are taken out of the queue at once.
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

SpoolSender::SpoolSender(PostSpool& spool, http::HTTPClient& http)
    : _spool(spool), _http(http), _news(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

bool SpoolSender::start(SectionSource& sections) {
  _spool.setSections(sections);
  if (!_news.isOpen()) return false;
  _spool.list();
  _spool.setWaker([this] { wake(); });
  return _thread.start("spool", std::max(kStackBytes, kConnectionStackBytes), [this] { run(); });
}

void SpoolSender::stop() {
  _stops = true;
  _spool.queue().stopSending();
  wake();
  _thread.join();
  _spool.setWaker(nullptr);
  fileEnded();
}

void SpoolSender::wake() {
  const std::uint64_t one = 1;
  if (::write(_news.get(), &one, sizeof one) < 0) return;  // it is awake, or there is no descriptor
}

void SpoolSender::run() {
  _word = _spool.rules().word({});
  _spool.load([this] { return _stops.load(); });
  while (!_stops) {
    fileEnded();
    const bool holds = _spool.queue().amount().posts > 0;
    if (holds) askAgain();
    _spool.dropExpired();
    double next = 0;
    for (const PostSpool::Name& name : _spool.queue().takeDue(next)) send(name);
    wait(holds ? std::min(next, kLook) : next);
    if (_watch.happened()) _spool.queue().woken();
  }
}

void SpoolSender::askAgain() {
  const SpoolRules::Word word = _spool.rules().word(_word);
  if (word == _word) return;
  _word = word;
  const auto all = _spool.rules().refusalOfAll();
  std::uint64_t after = 0;
  for (auto names = _spool.queue().names(after, kSome); !names.empty() && !_stops;
       names = _spool.queue().names(after, kSome)) {
    for (const PostSpool::Name& name : names) {
      after = name.order;
      if (all) {
        _spool.drop(name, *all);
        continue;
      }
      const auto post = _spool.read(name).entry;
      const auto refused = post ? _spool.refusalOf(*post) : std::nullopt;
      if (refused) _spool.drop(name, *refused, &*post);
    }
  }
}

void SpoolSender::send(const PostSpool::Name& name) {
  support::SpoolFolder::Read found = _spool.read(name);
  auto& read = found.entry;
  if (found.passes) {
    const http::HTTPError shortage{http::HTTPError::Kind::shortage,
                                   "The spool's file cannot be read just now"};
    static_cast<void>(_spool.queue().tried(name.order, Failure{shortage}));
    return;
  }
  if (!read) return _spool.drop(name, wire::Reason::spool_disk);
  SpoolQueue::AddressStatus address;
  const auto place = _spool.queue().place(name.order, address);
  if (!place) return;
  read->tries = place->tries;
  if (const auto refused = _spool.refusalBeforeTry(*read)) return _spool.drop(name, *refused, &*read);
  if (!_spool.queue().holds(name.order)) return;  // it was dropped while a storebag was fetched
  const auto post = std::make_shared<const support::SpoolEntry>(std::move(*read));
  _spool.begins(name);
  const auto ended = [this, post](const http::HTTPResult& result) {
    _spool.tried(*post, result);
    {
      const Lock held(_mutex);
      _ended.push_back(post);
    }
    wake();
  };
  if (const auto started = _http.start(requestOf(post), ended); !started) ended(Failure{started.error()});
}

void SpoolSender::fileEnded() {
  std::vector<std::shared_ptr<const support::SpoolEntry>> ended;
  {
    const Lock held(_mutex);
    ended.swap(_ended);
  }
  for (const auto& post : ended) _spool.filed(*post);
}

void SpoolSender::wait(double seconds) {
  std::array<pollfd, 2> events{{{_news.get(), POLLIN, 0}, {_watch.descriptor(), POLLIN, 0}}};
  ::poll(events.data(), events.size(), static_cast<int>(std::max(0.0, seconds) * 1000) + 1);
  std::uint64_t count = 0;
  if (::read(_news.get(), &count, sizeof count) < 0) return;  // the time is over
}

}  // namespace veltrad::backends
