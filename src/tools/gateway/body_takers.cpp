// SPDX-License-Identifier: Apache-2.0
// Takes events, files and log data.
#include "gateway/body_takers.h"

#include <fmt/format.h>

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

// A larger envelope is checked aside: one of this size takes some milliseconds. Log data always are, because
// a short list can hold the same long text many times.
constexpr std::size_t kLongTurnBytes = 64u << 10;

using Answering = std::function<void(Answer)>;

// The message's ID and, where the device has sent one, the post's.
void identify(Message& message, const Wanted& wanted, const std::string& digest) {
  message.id = wanted.postID.empty() ? digest : wanted.postID;
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

const char* reasonOf(Outcome outcome) {
  return outcome == Outcome::late ? "held_too_long" : "no_room";
}

// What becomes of the request: `answer` if the stream has taken the message.
Publisher::Completion answeringWith(const DoorServices& services, Answer answer,
                                    std::atomic<std::uint64_t>& counter, std::uint64_t events,
                                    Answering answering) {
  return [&services, answer = std::move(answer), &counter, events,
          answering = std::move(answering)](Outcome outcome) {
    if (outcome != Outcome::taken) return answering(services.refusals.busy(reasonOf(outcome)));
    counter.fetch_add(1, std::memory_order_relaxed);
    services.metrics.events.fetch_add(events, std::memory_order_relaxed);
    answering(answer);
  };
}

class EventsTaker final : public BodyTaker {
 public:
  EventsTaker(const DoorServices& services, Wanted wanted, Charge charge)
      : _services(services),
        _wanted(std::move(wanted)),
        _body(services, std::move(charge), _wanted.packed, services.bounds.events) {}

  std::optional<Answer> take(std::string_view& bytes) override { return _body.add(bytes); }
  bool hasRoom(std::function<void()>) override { return true; }

  void finish(Answering answering) override {
    if (auto refusal = _body.end()) return answering(std::move(*refusal));
    if (_body.text().size() <= kLongTurnBytes) return check(std::move(answering));
    _services.aside([this, answering = std::move(answering)]() mutable { check(std::move(answering)); });
  }

 private:
  void check(Answering answering) {
    const auto envelope = parseEnvelope(_body.text());
    if (!envelope) return answering(_services.refusals.malformed("events", envelope.error(), _body.text()));
    const std::uint64_t count = envelope.value().events.size();
    Message message{subject::kEvents, "", {}, {}};
    identify(message, _wanted, digestOf(_wanted.path, _body.text()));
    if (!_wanted.via.empty()) message.headers.emplace_back(header::kVia, _wanted.via);
    message.body = _body.take();
    if (!_body.becomes(message)) return answering(_services.refusals.busy("no_room"));
    publishWhole(_services.publisher, std::move(message),
                 answeringWith(_services, Answer{}, _services.metrics.posts, count, std::move(answering)));
  }

  const DoorServices& _services;
  const Wanted _wanted;
  ReceivedBody _body;
};

class LogDataTaker final : public BodyTaker {
 public:
  LogDataTaker(const DoorServices& services, Wanted wanted, Charge charge)
      : _services(services),
        _wanted(std::move(wanted)),
        _body(services, std::move(charge), _wanted.packed, services.bounds.logData) {}

  std::optional<Answer> take(std::string_view& bytes) override { return _body.add(bytes); }
  bool hasRoom(std::function<void()>) override { return true; }

  void finish(Answering answering) override {
    if (auto refusal = _body.end()) return answering(std::move(*refusal));
    _services.aside([this, answering = std::move(answering)]() mutable { check(std::move(answering)); });
  }

 private:
  void check(Answering answering) {
    auto text = json();
    if (!text) return answering(std::move(text.error()));
    const std::string digest = digestOf(_wanted.path, _body.text());
    const std::string location = "/logdata/" + digest.substr(0, kLocationDigits);
    Message message{subject::kLogData, "", {{header::kLocation, location}}, std::move(text).value()};
    identify(message, _wanted, digest);
    if (!_body.becomes(message)) return answering(_services.refusals.busy("no_room"));
    publishWhole(_services.publisher, std::move(message),
                 answeringWith(_services, Answer{200, location, "text/plain", {}}, _services.metrics.logData,
                               0, std::move(answering)));
  }

  // As JSON a list can be many times as long, so more than the bound is never written.
  Result<std::string, Answer> json() {
    const auto list = formats::parsePropertyList(_body.text(), kLogDataLimits);
    if (!list)
      return Failure{_services.refusals.malformed("log_data", list.error().description(), _body.text())};
    if (!list.value().asArray())
      return Failure{_services.refusals.malformed("log_data", "it is no array", _body.text())};
    auto text = formats::excerptOfJSON(list.value(), _services.bounds.logData);
    if (text.leftOut > 0)
      return Failure{_services.refusals.answer(
          {413, "too_large", fmt::format("as JSON it has more than {} bytes", _services.bounds.logData)})};
    text.text.shrink_to_fit();
    return std::move(text.text);
  }

  const DoorServices& _services;
  const Wanted _wanted;
  ReceivedBody _body;
};

// The stream has most of a large file before its end is known to be good; without the last piece nothing of
// it comes into the tables.
class FileTaker final : public BodyTaker {
 public:
  FileTaker(const DoorServices& services, Wanted wanted, Charge charge)
      : _services(services),
        _wanted(std::move(wanted)),
        _charge(std::move(charge)),
        _gunzip(services.bounds.unpackedFile),
        _pieces(services.publisher) {
    _message.add(_wanted.path);
    // A content that begins like the end of another path is another file.
    _message.add(std::string_view("\0", 1));
  }

  std::optional<Answer> take(std::string_view& bytes) override {
    if (const Outcome pieces = _pieces.outcome(); pieces != Outcome::taken)
      return _services.refusals.busy(reasonOf(pieces));
    std::string_view unpacked = bytes;
    const auto state = _gunzip.add(bytes, [this](std::string_view content) {
      _content.add(content);
      if (_wanted.postID.empty()) _message.add(content);
    });
    unpacked.remove_suffix(bytes.size());
    _received += unpacked.size();
    if (_received > _services.bounds.packedFile)
      return _services.refusals.answer({413, "too_large", "the file is too large"});
    if (state != support::Gunzip::State::open && state != support::Gunzip::State::ended)
      return refused(state, unpacked);
    _pieces.add(unpacked);
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
  const Charge _charge;
  support::Gunzip _gunzip;
  Digest _content;
  Digest _message;
  PieceWriter _pieces;
  std::uint64_t _received = 0;
};

}  // namespace

std::unique_ptr<BodyTaker> takeEvents(const DoorServices& services, Wanted wanted, Charge charge) {
  return std::make_unique<EventsTaker>(services, std::move(wanted), std::move(charge));
}
std::unique_ptr<BodyTaker> takeFile(const DoorServices& services, Wanted wanted, Charge charge) {
  return std::make_unique<FileTaker>(services, std::move(wanted), std::move(charge));
}
std::unique_ptr<BodyTaker> takeLogData(const DoorServices& services, Wanted wanted, Charge charge) {
  return std::make_unique<LogDataTaker>(services, std::move(wanted), std::move(charge));
}

}  // namespace veltrad::gateway
