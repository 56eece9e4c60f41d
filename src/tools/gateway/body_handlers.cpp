// SPDX-License-Identifier: Apache-2.0
// Takes events, files and log data.
#include "gateway/body_handlers.h"

#include <fmt/format.h>

#include "base/property_list.h"
#include "base/text.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "gateway/attempt.h"
#include "gateway/buffered_body.h"
#include "gateway/digest.h"
#include "gateway/envelope.h"
#include "gateway/piece_writer.h"

namespace veltrad::gateway {

namespace {

constexpr PropertyListLimits kLogDataLimits{32u << 20, 64, 500'000, 32u << 20};
constexpr std::size_t kLocationDigits = 32;

// A larger envelope is checked aside: one of this size takes some milliseconds. Log data always are, because
// a short list can hold the same long text many times.
constexpr std::size_t kLongTurnBytes = 64u << 10;

// The message's ID and, where the device has sent one, the post's.
void identify(Message& message, const ParsedRequest& request, const std::string& digest) {
  message.id = request.postID.empty() ? digest : request.postID;
  if (!request.postID.empty()) message.headers.emplace_back(header::kPostID, request.postID);
}

// Servers look for a header's name in the whole text of all, so no other one may hold what begins like
// theirs.
std::string headerText(const Dictionary& fields) {
  std::string text = formats::writeJSON(fields);
  for (std::size_t at = text.find("Nats-"); at != std::string::npos; at = text.find("Nats-", at))
    text.replace(at, 1, "\\u004e");
  return text;
}

// Has the stream take what the body holds. The request is answered when it has.
class StreamingHandler : public BodyHandler {
 public:
  Answer answer() final {
    if (_refusal) return std::move(*_refusal);
    return _outcome == Outcome::taken ? takenAnswer() : services.refusals.busy(reasonOf(_outcome));
  }

 protected:
  StreamingHandler(const HandlerServices& used, ParsedRequest given)
      : services(used), request(std::move(given)) {}

  // Also counts it.
  virtual Answer takenAnswer() = 0;
  void refuse(Answer refusal) { _refusal = std::move(refusal); }
  void end(Outcome outcome) { _outcome = outcome; }
  Publisher::Completion ending(const std::function<void()>& done) {
    return [this, done](Outcome outcome) {
      end(outcome);
      done();
    };
  }

  const HandlerServices& services;
  const ParsedRequest request;

 private:
  std::optional<Answer> _refusal;
  Outcome _outcome = Outcome::taken;
};

// A body that is checked when all of it has come.
class BufferedHandler : public StreamingHandler {
 public:
  std::optional<Answer> take(std::string_view& bytes) final { return body.add(bytes); }
  bool hasRoom(std::function<void()>) final { return true; }

  void finish(std::function<void()> done) final {
    if (auto refusal = body.end()) {
      refuse(std::move(*refusal));
      done();
    } else if (isShort()) {
      publish(done);
    } else {
      services.aside([this, done = std::move(done)] { publish(done); });
    }
  }

 protected:
  BufferedHandler(const HandlerServices& used, ParsedRequest given, Charge charge, std::uint64_t most)
      : StreamingHandler(used, std::move(given)), body(used, std::move(charge), request.packed, most) {}

  // Whether a check takes so little time that others may wait for it.
  virtual bool isShort() const = 0;
  // What the body becomes, or why it is refused.
  virtual Result<Message, Answer> check() = 0;

  BufferedBody body;

 private:
  void publish(const std::function<void()>& done) {
    const bool found = attempt([&] {
      auto message = check();
      if (message && body.becomes(message.value()))
        return publishWhole(services.publisher, std::move(message).value(), ending(done));
      refuse(message ? services.refusals.busy("no_room") : std::move(message.error()));
      done();
    });
    if (found) return;
    end(Outcome::shortage);
    done();
  }
};

class EventsHandler final : public BufferedHandler {
 public:
  EventsHandler(const HandlerServices& used, ParsedRequest given, Charge charge)
      : BufferedHandler(used, std::move(given), std::move(charge), used.bounds.events) {}

 private:
  bool isShort() const override { return body.text().size() <= kLongTurnBytes; }

  Result<Message, Answer> check() override {
    const auto envelope = parseEnvelope(body.text());
    if (!envelope) return Failure{services.refusals.malformed("events", envelope.error(), body.text())};
    _count = envelope.value().events.size();
    if (_count > services.bounds.eventsInOne)
      return Failure{services.refusals.malformed(
          "events", fmt::format("{} events, at most {} are taken", _count, services.bounds.eventsInOne),
          body.text())};
    Message message{subject::kEvents, "", {}, {}};
    identify(message, request, digestOf(request.path, body.text()));
    if (!request.via.empty()) message.headers.emplace_back(header::kVia, request.via);
    message.body = body.take();
    return message;
  }

  Answer takenAnswer() override {
    ++services.metrics.posts;
    services.metrics.events += _count;
    return {};
  }

  std::uint64_t _count = 0;
};

class LogDataHandler final : public BufferedHandler {
 public:
  LogDataHandler(const HandlerServices& used, ParsedRequest given, Charge charge)
      : BufferedHandler(used, std::move(given), std::move(charge), used.bounds.logData) {}

 private:
  bool isShort() const override { return false; }

  Result<Message, Answer> check() override {
    auto text = json();
    if (!text) return Failure{std::move(text.error())};
    const std::string digest = digestOf(request.path, body.text());
    _location = "/logdata/" + digest.substr(0, kLocationDigits);
    Message message{subject::kLogData, "", {{header::kLocation, _location}}, std::move(text).value()};
    identify(message, request, digest);
    return message;
  }

  // As JSON a list can be many times as long, so more than the bound is never written.
  Result<std::string, Answer> json() {
    const auto list = formats::parsePropertyList(body.text(), kLogDataLimits);
    if (!list)
      return Failure{services.refusals.malformed("log_data", list.error().description(), body.text())};
    if (!list.value().asArray())
      return Failure{services.refusals.malformed("log_data", "it is no array", body.text())};
    auto text = formats::excerptOfJSON(list.value(), services.bounds.logData);
    if (text.leftOut > 0)
      return Failure{services.refusals.answer(
          {413, "too_large", fmt::format("as JSON it has more than {} bytes", services.bounds.logData)})};
    text.text.shrink_to_fit();
    return std::move(text.text);
  }

  Answer takenAnswer() override {
    Answer answer{200, _location, "text/plain", {}};
    ++services.metrics.logData;
    return answer;
  }

  std::string _location;
};

// The stream has most of a large file before its end is known to be good; without the last piece nothing of
// it comes into the tables.
class FileHandler final : public StreamingHandler {
 public:
  FileHandler(const HandlerServices& used, ParsedRequest given, Charge charge)
      : StreamingHandler(used, std::move(given)),
        _charge(std::move(charge)),
        _gunzip(used.bounds.unpackedFile),
        _pieces(used.publisher) {
    _message.add(request.path);
    // A content that begins like the end of another path is another file.
    _message.add(std::string_view("\0", 1));
  }

  std::optional<Answer> take(std::string_view& bytes) override {
    if (const Outcome pieces = _pieces.outcome(); pieces != Outcome::taken)
      return services.refusals.busy(reasonOf(pieces));
    std::string_view unpacked = bytes;
    const auto state = _gunzip.add(bytes, [this](std::string_view content) {
      _content.add(content);
      if (request.postID.empty()) _message.add(content);
    });
    unpacked.remove_suffix(bytes.size());
    _received += unpacked.size();
    if (_received > services.bounds.packedFile)
      return services.refusals.answer({413, "too_large", "the file is too large"});
    if (state != support::Gunzip::State::open && state != support::Gunzip::State::ended)
      return services.refusals.gzip(state, services.bounds.unpackedFile, unpacked);
    _pieces.add(unpacked);
    return std::nullopt;
  }
  bool hasRoom(std::function<void()> resume) override { return _pieces.hasRoom(std::move(resume)); }

  void finish(std::function<void()> done) override {
    if (_gunzip.state() != support::Gunzip::State::ended) {
      refuse(services.refusals.gzip(_gunzip.state(), services.bounds.unpackedFile, ""));
      return done();
    }
    const Dictionary file{{"uuid", parameter("uuid")},         {"sequence", parameter("sequence")},
                          {"filename", parameter("filename")}, {"description", parameter("description")},
                          {"sha256", _content.hexDigits()},    {"bytes", _gunzip.unpackedBytes()}};
    Message message{subject::kFiles, "", {{header::kFile, headerText(file)}}, {}};
    identify(message, request, _message.hexDigits());
    _pieces.commit(std::move(message), ending(done));
  }

 private:
  Answer takenAnswer() override {
    Answer answer{200, "{\"success\":true}", "application/json", {}};
    ++services.metrics.files;
    return answer;
  }
  std::string parameter(const char* name) const {
    const auto found = request.query.find(name);
    return found == request.query.end() ? "" : found->second;
  }

  const Charge _charge;
  support::Gunzip _gunzip;
  Digest _content;
  Digest _message;
  PieceWriter _pieces;
  std::uint64_t _received = 0;
};

}  // namespace

std::unique_ptr<BodyHandler> handlerFor(const HandlerServices& services, ParsedRequest request,
                                        Charge charge) {
  if (request.place == Place::events)
    return std::make_unique<EventsHandler>(services, std::move(request), std::move(charge));
  if (request.place == Place::upload)
    return std::make_unique<FileHandler>(services, std::move(request), std::move(charge));
  return std::make_unique<LogDataHandler>(services, std::move(request), std::move(charge));
}

}  // namespace veltrad::gateway
