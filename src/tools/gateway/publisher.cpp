// SPDX-License-Identifier: Apache-2.0
// Publishes what is due and completes what was answered or is too late.
#include "gateway/publisher.h"

#include "base/text.h"
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
  const auto begun = std::chrono::steady_clock::now();
  // A shared function, because what could not be added is still to be called.
  auto shared = std::make_shared<Completion>(std::move(completion));
  bool added = false;
  {
    const Lock hold(_mutex);
    added = !_stopping && _held.add(
                              std::move(message),
                              [shared, begun, &metrics = _metrics](Outcome outcome) {
                                if (outcome == Outcome::taken)
                                  metrics.published(std::chrono::steady_clock::now() - begun);
                                (*shared)(outcome);
                              },
                              begun);
  }
  if (added)
    _changed.notifyOne();
  else
    (*shared)(Outcome::full);
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
  std::vector<Completion> completions;
  {
    const Lock hold(_mutex);
    if (why.empty())
      completions = _held.taken(token);
    else
      _held.refused(token, std::chrono::steady_clock::now());
  }
  if (!why.empty()) {
    if (const auto line = _refusals.happened("stream: a message was not taken: " + why))
      logWarning("%s", line->c_str());
    _changed.notifyOne();
  }
  for (const Completion& completion : completions) completion(Outcome::taken);
}

void Publisher::run() {
  for (;;) {
    std::vector<HeldMessages::Due> due;
    std::vector<Completion> late;
    bool ends = false;
    {
      const Lock hold(_mutex);
      const auto now = std::chrono::steady_clock::now();
      late = _held.expired(now);
      due = _held.due(now);
      ends = _stopping && late.empty();
      if (late.empty() && due.empty() && !ends) {
        if (const auto next = _held.next())
          _changed.waitUntil(_mutex, *next);
        else
          _changed.wait(_mutex);
      }
    }
    if (ends) return;
    for (const Completion& completion : late) completion(Outcome::late);
    for (const auto& [token, message] : due) _stream->publish(token, *message);
  }
}

}  // namespace veltrad::gateway
