// SPDX-License-Identifier: Apache-2.0
// Takes events, files and log data.
#include "gateway/body_takers.h"

#include <fmt/format.h>

#include <algorithm>

#include "base/property_list.h"
#include "base/text.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "gateway/digest.h"
#include "gateway/envelope.h"
#include "gateway/piece_writer.h"
#include "gateway/received_body.h"

namespace veltrad::gateway {

namespace {

constexpr PropertyListLimits kLogDataLimits{32u << 20, 64, 500'000, 32u << 20};
constexpr std::size_t kLocationDigits = 32;
// What a file keeps in memory at most: pieces under way, and the next one.
constexpr std::uint64_t kMostFileBytes = 5 * kPieceBytes;

using Answering = std::function<void(Answer)>;

// The message's ID and, where the device has sent one, the post's.
void identify(Message& message, const Wanted& wanted, std::string digest) {
  message.id = wanted.postID.empty() ? std::move(digest) : wanted.postID;
  if (!wanted.postID.empty()) message.headers.emplace_back(header::kPostID, wanted.postID);
}

// Servers look for a header's name in the whole text of all, so no other one may hold what begins like
// theirs.
std::string headerText(const Dictionary& fields) {
  std::string text = formats::writeJSON(fields);
  for (std::size_t at = text.find("Nats-"); at != std::string::npos; at = text.find("Nats-", at))
    text.replace(at, 1, "\\u004e");
  return text;
}

// What becomes of the request: `answer` if the stream has taken the message.
Publisher::Completion answeringWith(const DoorServices& services, Answer answer,
                                    std::atomic<std::uint64_t>& counter, std::uint64_t events,
                                    Answering answering) {
  return [&services, answer = std::move(answer), &counter, events,
          answering = std::move(answering)](Outcome outcome) {
    if (outcome != Outcome::taken)
      return answering(services.refusals.busy(outcome == Outcome::late ? "held_too_long" : "no_room"));
    counter.fetch_add(1, std::memory_order_relaxed);
    services.metrics.events.fetch_add(events, std::memory_order_relaxed);
    answering(answer);
  };
}

class EventsTaker final : public BodyTaker {
 public:
  EventsTaker(const DoorServices& services, Wanted wanted)
      : _services(services),
        _wanted(std::move(wanted)),
        _body(services, _wanted.packed, services.bounds.events) {}

  std::optional<Answer> take(std::string_view bytes) override { return _body.add(bytes); }
  bool hasRoom(std::function<void()>) override { return true; }

  void finish(Answering answering) override {
    if (auto refusal = _body.end()) return answering(std::move(*refusal));
    const auto envelope = parseEnvelope(_body.text());
    if (!envelope) return answering(_services.refusals.malformed("events", envelope.error(), _body.text()));
    const std::uint64_t count = envelope.value().events.size();
    Message message{subject::kEvents, "", {}, {}};
    identify(message, _wanted, digestOf(_wanted.path, _body.text()));
    if (!_wanted.via.empty()) message.headers.emplace_back(header::kVia, _wanted.via);
    message.body = _body.take();
    publishWhole(_services.publisher, std::move(message),
                 answeringWith(_services, Answer{}, _services.metrics.posts, count, std::move(answering)));
  }

 private:
  const DoorServices& _services;
  const Wanted _wanted;
  ReceivedBody _body;
};

class LogDataTaker final : public BodyTaker {
 public:
  LogDataTaker(const DoorServices& services, Wanted wanted)
      : _services(services),
        _wanted(std::move(wanted)),
        _body(services, _wanted.packed, services.bounds.logData) {}

  std::optional<Answer> take(std::string_view bytes) override { return _body.add(bytes); }
  bool hasRoom(std::function<void()>) override { return true; }

  void finish(Answering answering) override {
    if (auto refusal = _body.end()) return answering(std::move(*refusal));
    const auto list = formats::parsePropertyList(_body.text(), kLogDataLimits);
    if (!list)
      return answering(_services.refusals.malformed("log_data", list.error().description(), _body.text()));
    if (!list.value().asArray())
      return answering(_services.refusals.malformed("log_data", "it is no array", _body.text()));
    std::string text = formats::writeJSON(list.value());
    if (text.size() > _services.bounds.logData)
      return answering(_services.refusals.answer({413, "too_large",
                                                  fmt::format("as JSON it has {} bytes, at most {} are taken",
                                                              text.size(), _services.bounds.logData)}));
    std::string digest = digestOf(_wanted.path, _body.text());
    const std::string location = "/logdata/" + digest.substr(0, kLocationDigits);
    Message message{subject::kLogData, "", {{header::kLocation, location}}, std::move(text)};
    identify(message, _wanted, std::move(digest));
    publishWhole(_services.publisher, std::move(message),
                 answeringWith(_services, Answer{200, location, "text/plain", {}}, _services.metrics.logData,
                               0, std::move(answering)));
  }

 private:
  const DoorServices& _services;
  const Wanted _wanted;
  ReceivedBody _body;
};

// The stream has most of a large file before its end is known to be good; without the last piece nothing of
// it comes into the tables.
class FileTaker final : public BodyTaker {
 public:
  FileTaker(const DoorServices& services, Wanted wanted)
      : _services(services),
        _wanted(std::move(wanted)),
        _gunzip(services.bounds.unpackedFile),
        _pieces(services.publisher),
        _bytes(std::min(_wanted.length.value_or(kMostFileBytes), kMostFileBytes)),
        _charged(services.fileBudget.take(_bytes)) {
    _message.add(_wanted.path);
  }
  ~FileTaker() override {
    if (_charged) _services.fileBudget.give(_bytes);
  }

  std::optional<Answer> take(std::string_view bytes) override {
    if (!_charged) return _services.refusals.busy("no_room");
    if (_pieces.outcome() != Outcome::taken) return _services.refusals.busy("piece_not_taken");
    _received += bytes.size();
    if (_received > _services.bounds.packedFile)
      return _services.refusals.answer({413, "too_large", "the file is too large"});
    const auto state = _gunzip.add(bytes, [this](std::string_view unpacked) {
      _content.add(unpacked);
      _message.add(unpacked);
    });
    if (state != support::Gunzip::State::open && state != support::Gunzip::State::ended)
      return refused(state, bytes);
    _pieces.add(bytes);
    return std::nullopt;
  }
  bool hasRoom(std::function<void()> resume) override { return _pieces.hasRoom(std::move(resume)); }

  void finish(Answering answering) override {
    if (_gunzip.state() != support::Gunzip::State::ended) return answering(refused(_gunzip.state(), ""));
    const Dictionary file{{"uuid", parameter("uuid")},         {"sequence", parameter("sequence")},
                          {"filename", parameter("filename")}, {"description", parameter("description")},
                          {"sha256", _content.hexDigits()},    {"bytes", _gunzip.unpackedBytes()}};
    Message message{subject::kFiles, "", {{header::kFile, headerText(file)}}, {}};
    identify(message, _wanted, _message.hexDigits());
    _pieces.commit(std::move(message),
                   answeringWith(_services, Answer{200, "{\"success\":true}", "application/json", {}},
                                 _services.metrics.files, 0, std::move(answering)));
  }

 private:
  Answer refused(support::Gunzip::State state, std::string_view bytes) {
    const Refusal refusal = refusalOf(state, _services.bounds.unpackedFile);
    if (state == support::Gunzip::State::shortage) return _services.refusals.busy("no_memory");
    return refusal.status == 400 ? _services.refusals.malformed(refusal.reason, refusal.detail, bytes)
                                 : _services.refusals.answer(refusal);
  }
  std::string parameter(const char* name) const {
    const auto found = _wanted.query.find(name);
    return found == _wanted.query.end() ? "" : found->second;
  }

  const DoorServices& _services;
  const Wanted _wanted;
  support::Gunzip _gunzip;
  Digest _content;
  Digest _message;
  PieceWriter _pieces;
  const std::uint64_t _bytes;
  const bool _charged;
  std::uint64_t _received = 0;
};

}  // namespace

std::unique_ptr<BodyTaker> takeEvents(const DoorServices& services, Wanted wanted) {
  return std::make_unique<EventsTaker>(services, std::move(wanted));
}
std::unique_ptr<BodyTaker> takeFile(const DoorServices& services, Wanted wanted) {
  return std::make_unique<FileTaker>(services, std::move(wanted));
}
std::unique_ptr<BodyTaker> takeLogData(const DoorServices& services, Wanted wanted) {
  return std::make_unique<LogDataTaker>(services, std::move(wanted));
}

}  // namespace veltrad::gateway
