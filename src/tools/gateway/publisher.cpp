// SPDX-License-Identifier: Apache-2.0
// Publishes what is due and completes what was answered or is too late.
#include "gateway/publisher.h"

#include "gateway/attempt.h"
#include "platform/log.h"

namespace veltrad::gateway {

namespace {
constexpr std::size_t kPublisherStackBytes = 256u << 10;
}

Result<std::unique_ptr<Publisher>, std::string> Publisher::open(const StreamOptions& stream,
                                                                HeldMessages::Bounds bounds,
                                                                Metrics& metrics) {
  std::unique_ptr<Publisher> self(new Publisher(bounds, metrics));
  Publisher* raw = self.get();
  const auto back = [raw] {
    const Lock hold(raw->_mutex);
    raw->_held.allDue(std::chrono::steady_clock::now());
    raw->_changed.notifyOne();
  };
  auto opened = Stream::open(
      stream, {[raw](std::uint64_t token, const std::string& why) { raw->answered(token, why); }, back});
  if (!opened) return Failure{std::move(opened.error())};
  self->_stream = std::move(opened).value();
  if (!self->_thread.start("publisher", kPublisherStackBytes, [raw] { raw->run(); }))
    return Failure{std::string("a thread cannot be started")};
  return self;
}

Publisher::~Publisher() {
  {
    const Lock hold(_mutex);
    _stopping = true;
    _held.endBy(std::chrono::steady_clock::now());
  }
  _changed.notifyOne();
  _thread.join();
}

void Publisher::publish(Message message, Completion completion) {
  bool added = false;
  const bool found = attempt([&] {
    const Lock hold(_mutex);
    added = !_stopping && _held.add(std::move(message), completion, std::chrono::steady_clock::now());
  });
  if (added)
    _changed.notifyOne();
  else
    completion(found ? Outcome::full : Outcome::shortage);
}

void Publisher::endBy(HeldMessages::Time end) {
  {
    const Lock hold(_mutex);
    _held.endBy(end);
  }
  _changed.notifyOne();
}

std::size_t Publisher::held() const {
  const Lock hold(_mutex);
  return _held.messages();
}

void Publisher::answered(std::uint64_t token, const std::string& why) {
  const auto now = std::chrono::steady_clock::now();
  std::vector<HeldMessages::Waiter> waiters;
  {
    const Lock hold(_mutex);
    if (why.empty())
      waiters = _held.taken(token);
    else
      _held.refused(token, now);
  }
  for (const auto& waiter : waiters) {
    _metrics.published(now - waiter.since);
    attempt([&] { waiter.completion(Outcome::taken); });
  }
  if (why.empty()) return;
  _changed.notifyOne();
  if (const auto line = _refusals.happened("stream: a message was not taken: " + why))
    logWarning("%s", line->c_str());
}

void Publisher::run() {
  for (;;) {
    std::vector<HeldMessages::Waiter> late;
    std::optional<HeldMessages::Due> due;
    {
      const Lock hold(_mutex);
      const auto now = std::chrono::steady_clock::now();
      late = _held.expired(now);
      if (late.empty()) due = _held.due(now);
      if (late.empty() && !due) {
        if (_stopping) return;
        if (const auto next = _held.next())
          _changed.waitUntil(_mutex, *next);
        else
          _changed.wait(_mutex);
      }
    }
    for (const auto& waiter : late) attempt([&] { waiter.completion(Outcome::late); });
    // It is due again if there is no memory for it now.
    if (due) attempt([&] { _stream->publish(due->token, *due->message); });
  }
}

}  // namespace veltrad::gateway
