// SPDX-License-Identifier: Apache-2.0
// Restarts after every error: with new connections, and from the position in the database.
#include "gateway/drain.h"

#include <unistd.h>

#include <cstdio>
#include <ctime>

#include "gateway/admin.h"
#include "gateway/attempt.h"
#include "gateway/metrics.h"
#include "gateway/serve.h"
#include "platform/limited_line.h"
#include "platform/log.h"

namespace veltrad::gateway {

namespace {

constexpr std::size_t kDrainStackBytes = 1u << 20;
constexpr std::chrono::milliseconds kBetweenTries{500};
constexpr std::chrono::hours kBetweenForgettings{1};
constexpr std::chrono::seconds kBetweenPurges{1};
// In nanoseconds.
constexpr double kDay = 86'400e9;

std::int64_t nowNanoseconds() {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  return std::int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

}  // namespace

void PurgePlan::reached(std::uint64_t seq, Time now) {
  // One place for each second is precise enough.
  if (!_reached.empty() && now - _reached.back().first < kBetweenPurges && _reached.size() > 1)
    _reached.back().second = seq;
  else
    _reached.emplace_back(now, seq);
}

std::optional<std::uint64_t> PurgePlan::due(Time now) {
  std::optional<std::uint64_t> seq;
  while (!_reached.empty() && now - _reached.front().first >= _after) {
    seq = _reached.front().second;
    _reached.pop_front();
  }
  return seq;
}

bool LostTail::isCertain(std::uint64_t reached, std::uint64_t last, Time now) {
  if (last >= reached) {
    _since.reset();
    return false;
  }
  if (!_since) _since = now;
  return now - *_since >= kLongestCatchUp;
}

std::string DrainCounts::text() const {
  std::string text = counterText("veltra_drain_events", "Events written to the tables.", events);
  text += counterText("veltra_drain_messages", "Messages read from the stream and written.", messages);
  text += counterText("veltra_drain_skipped", "Posts that the tables had already.", skipped);
  text +=
      counterText("veltra_drain_refused", "Messages that no table takes, now in veltra.refused.", refused);
  text += counterText("veltra_drain_restarts", "How often it began anew after an error.", restarts);
  text += gaugeText("veltra_drain_lag_messages", "Messages in the stream that were not written yet.",
                    static_cast<double>(behind));
  const double lag = behind > 0 ? static_cast<double>(nowNanoseconds() - waitingSince) / 1e9 : 0;
  text += gaugeText("veltra_drain_lag_seconds", "How long the oldest of them has waited, at most.", lag);
  return text + kEndOfMetrics;
}

Drain::Drain(StreamOptions stream, DrainArguments given)
    : _stream(std::move(stream)),
      _given(std::move(given)),
      _files(_given.files),
      _purges(std::chrono::duration<double>(_given.purgeAfter)) {}

Result<Done, std::string> Drain::start() {
  if (auto opened = _files.open(); !opened) return Failure{"--files " + opened.error().detail};
  if (!_thread.start("drain", kDrainStackBytes, [this] { run(); }))
    return Failure{std::string("a thread cannot be started")};
  return Done();
}

void Drain::stop() {
  {
    const Lock hold(_mutex);
    _stopping = true;
  }
  _changed.notifyAll();
  _thread.join();
}

bool Drain::stopping() {
  const Lock hold(_mutex);
  return _stopping;
}

bool Drain::pause(std::chrono::milliseconds time) {
  const Lock hold(_mutex);
  if (!_stopping) _changed.waitUntil(_mutex, std::chrono::steady_clock::now() + time);
  return !_stopping;
}

void Drain::run() {
  platform::LimitedLine failures("failures");
  std::unique_ptr<StreamReader> looking;
  while (!stopping()) {
    std::string why = "no memory";
    attempt([&] { why = runOnce(); });
    _counts.active = false;
    if (why.empty()) continue;
    ++_counts.restarts;
    attempt([&] {
      if (const auto line = failures.happened("drain: " + why)) logWarning("%s", line->c_str());
      if (!looking || looking->isOver()) {
        if (auto opened = StreamReader::open(_stream)) looking = std::move(opened).value();
      }
      if (looking) measure(*looking);
    });
    pause(kBetweenTries);
  }
}

// The number of waiting messages matters most while nothing can be written.
void Drain::measure(StreamReader& reader) {
  const auto state = reader.state();
  if (!state) return;
  const std::uint64_t read = std::max(_reached, std::max<std::uint64_t>(state.value().firstSeq, 1) - 1);
  const std::uint64_t last = state.value().lastSeq;
  if (_counts.behind.exchange(last > read ? last - read : 0) == 0) _counts.waitingSince = nowNanoseconds();
}

std::string Drain::runOnce() {
  auto database = Database::open(
      _given.database, std::chrono::milliseconds(static_cast<std::int64_t>(_given.statement * 1'000)));
  if (!database) return database.error().detail;
  auto active = TableWriter::becomeActive(*database.value(), _stream.name);
  if (!active) return active.error().detail;
  if (!active.value()) {
    logInfo("drain: another drain is active; waiting");
    while (!active.value()) {
      if (!pause(kBetweenTries)) return "";
      active = TableWriter::becomeActive(*database.value(), _stream.name);
      if (!active) return active.error().detail;
    }
  }
  if (auto prepared = TableWriter::prepare(*database.value()); !prepared) return prepared.error().detail;
  auto reader = StreamReader::open(_stream);
  if (!reader) return reader.error();
  TableWriter writer(std::move(database).value(), _files, _stream.name);
  return carry(*reader.value(), writer);
}

std::string Drain::carry(StreamReader& reader, TableWriter& writer) {
  auto state = reader.state();
  while (!state && !reader.isOver() && pause(kBetweenTries)) state = reader.state();
  if (!state) return stopping() ? "" : state.error();
  const auto place = findPlace(reader, writer, state.value());
  if (!place) return place.error();
  if (stopping()) return "";
  _reached = place.value();
  _silentAt = 0;
  // The places of a stream that was there before mean nothing in this one.
  _purges = PurgePlan(std::chrono::duration<double>(_given.purgeAfter));
  if (_reached > 0) _purges.reached(_reached, std::chrono::steady_clock::now());
  if (auto begun = reader.startBehind(_reached); !begun) return begun.error();
  if (const auto line =
          _begins.happened("drain: reads " + _stream.name + " behind " + std::to_string(_reached)))
    logInfo("%s", line->c_str());
  _counts.active = true;
  std::int64_t read = 0;
  while (!stopping()) {
    const auto messages = reader.read(_given.batch);
    if (!messages) return messages.error();
    _counts.behind = reader.behind() + messages.value().size();
    if (messages.value().empty()) {
      if (std::string why = lookAgain(reader, state.value().created); !why.empty()) return why;
    } else {
      _counts.waitingSince = messages.value().front().time;
      const auto written = writer.write(messages.value());
      if (!written) return written.error().detail;
      _reached = messages.value().back().seq;
      _counts.events += written.value().events;
      _counts.messages += messages.value().size();
      _counts.skipped += written.value().skipped;
      _counts.refused += written.value().refused;
      _counts.behind = reader.behind();
      _counts.waitingSince = read = messages.value().back().time;
      _purges.reached(_reached, std::chrono::steady_clock::now());
    }
    keepHouse(reader, writer, read);
  }
  return "";
}

Result<std::uint64_t, std::string> Drain::findPlace(StreamReader& reader, TableWriter& writer,
                                                    StreamState& state) {
  const auto position = writer.position(state.created);
  if (!position) return Failure{position.error().detail};
  const auto [seq, time] = position.value();
  LostTail tail;
  while (state.lastSeq < seq && !tail.isCertain(seq, state.lastSeq, std::chrono::steady_clock::now())) {
    if (!pause(kBetweenTries)) return seq;
    const auto next = reader.state();
    if (!next) return Failure{next.error()};
    if (next.value().created != state.created) return Failure{std::string("the stream was made anew")};
    state = next.value();
  }
  bool lost = state.lastSeq < seq;
  if (!lost && time > 0 && state.firstSeq <= seq) {
    const auto found = reader.timeAt(seq);
    if (!found) return Failure{found.error()};
    lost = found.value().value_or(time) != time;
  }
  if (!lost) {
    if (state.firstSeq > seq + 1)
      logWarning("drain: the stream begins with message %llu, the tables end with %llu",
                 static_cast<unsigned long long>(state.firstSeq), static_cast<unsigned long long>(seq));
    return seq;
  }
  auto common = placeUpTo(reader, state, seq, time);
  if (!common) return common;
  logWarning("drain: the stream has lost its messages from %llu to %llu, which the tables have",
             static_cast<unsigned long long>(common.value() + 1), static_cast<unsigned long long>(seq));
  if (auto moved = writer.goBack(common.value()); !moved) return Failure{moved.error().detail};
  return common;
}

// Times grow with places, so messages newer than the tables' last one have replaced lost ones.
Result<std::uint64_t, std::string> Drain::placeUpTo(StreamReader& reader, const StreamState& state,
                                                    std::uint64_t seq, std::int64_t time) {
  std::uint64_t low = std::min(std::max<std::uint64_t>(state.firstSeq, 1) - 1, seq);
  std::uint64_t high = std::min(state.lastSeq, seq);
  while (low < high) {
    const std::uint64_t middle = high - (high - low) / 2;
    const auto found = reader.timeAt(middle);
    if (!found) return Failure{found.error()};
    if (found.value().value_or(0) <= time)
      low = middle;
    else
      high = middle - 1;
  }
  return low;
}

// Nothing came. A consumer that was lost with its server is silent, too, so the stream is checked.
std::string Drain::lookAgain(StreamReader& reader, std::int64_t created) {
  const auto state = reader.state();
  if (!state) return state.error();
  if (state.value().created != created) return "the stream was made anew";
  if (state.value().lastSeq < _reached) return "the stream has less than the tables";
  const bool goesOn = state.value().lastSeq > _reached && state.value().firstSeq <= state.value().lastSeq;
  // The first time a message may just be on its way.
  const bool silentBefore = std::exchange(_silentAt, goesOn ? _reached + 1 : 0) == _reached + 1;
  return goesOn && silentBefore ? "the consumer delivers nothing" : "";
}

void Drain::keepHouse(StreamReader& reader, TableWriter& writer, std::int64_t read) {
  const auto now = std::chrono::steady_clock::now();
  if (const auto seq = _purges.due(now)) {
    if (auto purged = reader.purge(*seq); !purged) logWarning("drain: %s", purged.error().c_str());
  }
  if (now < _nextForgetting) return;
  _nextForgetting = now + kBetweenForgettings;
  if (read > 0) _files.forgetUnfinished(read);
  if (auto forgotten = writer.forget(_given.postDays, _given.keepDays); !forgotten)
    logWarning("drain: nothing was forgotten: %s", forgotten.error().detail.c_str());
  else if (_given.keepDays > 0)
    _files.forgetDaysBefore(dayText(nowNanoseconds() - static_cast<std::int64_t>(_given.keepDays * kDay)));
}

int drain(const Arguments& given) {
  blockStopSignals();
  StreamOptions stream = given.stream;
  stream.inbox = "_INBOX.veltra-drain";
  Drain carrying(std::move(stream), given.drain);
  const DrainCounts& counts = carrying.counts();
  Admin admin({[&counts] { return counts.active ? "" : "it does not read the stream"; },
               [&counts] { return counts.text(); }});
  const auto looked = admin.start(given.drain.admin);
  const auto started = looked ? carrying.start() : Result<Done, std::string>(Done());
  if (!looked || !started) {
    std::fprintf(stderr, "veltra-gateway: %s\n",
                 looked ? started.error().c_str() : ("--admin " + looked.error()).c_str());
    return 1;
  }
  sayReady({{"admin", asURL(looked.value())}, {"pid", static_cast<long>(::getpid())}});
  awaitStop();
  carrying.stop();
  return 0;
}

}  // namespace veltrad::gateway
