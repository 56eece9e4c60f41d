// SPDX-License-Identifier: Apache-2.0
// Publishes with a reply subject for each message, and reads the answers.
#include "gateway/stream.h"

#include <nats/nats.h>

#include <charconv>
#include <chrono>
#include <future>
#include <optional>
#include <string_view>

#include "formats/json.h"
#include "gateway/attempt.h"
#include "platform/log.h"
#include "platform/uuid.h"

namespace veltrad::gateway {

namespace {

constexpr std::size_t kWatchStackBytes = 256u << 10;
constexpr std::int64_t kAnswerMilliseconds = 1'500;
constexpr std::int64_t kDuplicatesNanoseconds = 120'000'000'000;
constexpr int kMostAnswersWaiting = 1 << 20;
constexpr std::chrono::seconds kLongestUnsubscribe{5};
constexpr const char* kStatusHeader = "Status";

// Empty if the stream has taken the message.
std::string refusalIn(natsMsg* answer) {
  const char* status = nullptr;
  if (natsMsg_GetDataLength(answer) == 0)
    return natsMsgHeader_Get(answer, kStatusHeader, &status) == NATS_OK
               ? std::string("nobody listens, status ") + status
               : "an empty answer";
  return refusalInAnswer({natsMsg_GetData(answer), static_cast<std::size_t>(natsMsg_GetDataLength(answer))});
}

}  // namespace

std::string refusalInAnswer(std::string_view text) {
  const auto parsed = formats::parseJSON(text);
  const Dictionary* fields = parsed ? parsed.value().asDictionary() : nullptr;
  if (!fields) return "an answer that is no object";
  if (const Dictionary* error = fields->dictionary("error")) {
    const std::string* description = error->string("description");
    return description && !description->empty() ? *description : "an error without a description";
  }
  const Value* seq = fields->find("seq");
  // Some servers answer 0 for an ID that is only on its way into the stream, which it may never reach.
  return seq && seq->toInt64().value_or(0) > 0 ? "" : "an answer without a place in the stream";
}

// A connection and the subscription to the answers.
struct Stream::Link {
  static Result<std::shared_ptr<Link>, std::string> open(const StreamOptions& options,
                                                         const Listener& listener);
  explicit Link(const Listener& listening) : listener(listening) {}
  ~Link();

  static void answered(natsConnection*, natsSubscription*, natsMsg* answer, void* closure);
  static void unsubscribedNow(void* closure) { static_cast<Link*>(closure)->unsubscribed.set_value(); }

  const Listener& listener;
  std::unique_ptr<NATSConnection> connection;
  natsSubscription* answers = nullptr;
  // Answers to a message come to this and its token.
  std::string inbox;
  // No answer follows.
  std::promise<void> unsubscribed;
};

void Stream::Link::answered(natsConnection*, natsSubscription*, natsMsg* answer, void* closure) {
  const auto* self = static_cast<Link*>(closure);
  const std::string_view subject = natsMsg_GetSubject(answer);
  std::uint64_t token = 0;
  if (subject.size() > self->inbox.size())
    std::from_chars(subject.data() + self->inbox.size(), subject.data() + subject.size(), token);
  // An answer that there is no memory for comes again, because its message does.
  attempt([&] { self->listener.answered(token, refusalIn(answer)); });
  natsMsg_Destroy(answer);
}

Result<std::shared_ptr<Stream::Link>, std::string> Stream::Link::open(const StreamOptions& options,
                                                                      const Listener& listener) {
  auto made = std::make_shared<Link>(listener);
  auto connection = NATSConnection::open(options, listener.back);
  if (!connection) return Failure{std::move(connection.error())};
  made->connection = std::move(connection).value();
  made->inbox = options.inbox + "." + platform::randomUUIDText() + ".";
  natsStatus status = natsConnection_Subscribe(&made->answers, made->connection->get(),
                                               (made->inbox + "*").c_str(), &Link::answered, made.get());
  if (status == NATS_OK)
    status = natsSubscription_SetOnCompleteCB(made->answers, &Link::unsubscribedNow, made.get());
  if (status == NATS_OK) status = natsSubscription_SetPendingLimits(made->answers, kMostAnswersWaiting, -1);
  if (status != NATS_OK) return Failure{std::string("no answers can be read: ") + natsStatus_GetText(status)};
  return made;
}

Stream::Link::~Link() {
  if (!answers) return;
  natsSubscription_Unsubscribe(answers);
  unsubscribed.get_future().wait_for(kLongestUnsubscribe);
  natsSubscription_Destroy(answers);
}

Stream::Stream(StreamOptions options, Listener listener)
    : _options(std::move(options)), _listener(std::move(listener)) {}

Result<std::unique_ptr<Stream>, std::string> Stream::open(StreamOptions options, Listener listener) {
  std::unique_ptr<Stream> self(new Stream(std::move(options), std::move(listener)));
  auto link = Link::open(self->_options, self->_listener);
  if (!link) return Failure{std::move(link.error())};
  Stream* raw = self.get();
  {
    const Lock hold(raw->_mutex);
    raw->_link = std::move(link).value();
  }
  if (!self->_watch.start("stream watch", kWatchStackBytes, [raw] { raw->watch(); }))
    return Failure{std::string("a thread cannot be started")};
  return self;
}

Stream::~Stream() {
  {
    const Lock hold(_mutex);
    _stopping = true;
  }
  _changed.notifyAll();
  _watch.join();
}

std::shared_ptr<Stream::Link> Stream::link() {
  const Lock hold(_mutex);
  return _link;
}

void Stream::renew() {
  if (!link()->connection->isOver()) return;
  logWarning("stream: the servers refuse this connection for good; another one is made");
  auto next = Link::open(_options, _listener);
  if (!next) return;
  std::shared_ptr<Link> made = std::move(next).value();
  // The old one goes when nobody holds it, and not under the lock.
  const Lock hold(_mutex);
  _link.swap(made);
}

void Stream::publish(std::uint64_t token, const Message& message) {
  const std::shared_ptr<Link> now = link();
  if (!now->connection->connected()) return;
  natsMsg* made = nullptr;
  const std::string to = _options.prefix + message.subject;
  const std::string answerTo = now->inbox + std::to_string(token);
  natsStatus status = natsMsg_Create(&made, to.c_str(), answerTo.c_str(), message.body.data(),
                                     static_cast<int>(message.body.size()));
  if (status == NATS_OK) status = natsMsgHeader_Set(made, header::kMessageID, message.id.c_str());
  for (const auto& [name, text] : message.headers) {
    if (status == NATS_OK) status = natsMsgHeader_Set(made, name.c_str(), text.c_str());
  }
  if (status == NATS_OK) status = natsConnection_PublishMsg(now->connection->get(), made);
  natsMsg_Destroy(made);
  // It is published again when no answer comes.
  if (status == NATS_OK) return;
  if (const auto line = _unpublished.happened(std::string("stream: a message was not published: ") +
                                              natsStatus_GetText(status)))
    logWarning("%s", line->c_str());
}

std::string Stream::faultOfStream() {
  renew();
  const std::shared_ptr<Link> now = link();
  if (!now->connection->connected()) return "no server can be reached";
  jsOptions options;
  jsOptions_Init(&options);
  options.Wait = kAnswerMilliseconds;
  jsStreamInfo* info = nullptr;
  jsErrCode error = static_cast<jsErrCode>(0);
  natsStatus status =
      js_GetStreamInfo(&info, now->connection->jetStream(), _options.name.c_str(), &options, &error);
  if (status == NATS_NOT_FOUND && error == JSStreamNotFoundErr) {
    const std::string all = _options.prefix + ">";
    const char* subjects[] = {all.c_str()};
    jsStreamConfig wanted;
    jsStreamConfig_Init(&wanted);
    wanted.Name = _options.name.c_str();
    wanted.Subjects = subjects;
    wanted.SubjectsLen = 1;
    wanted.Discard = js_DiscardNew;
    wanted.Storage = js_FileStorage;
    wanted.Replicas = _options.copies;
    wanted.Duplicates = kDuplicatesNanoseconds;
    if (_options.mostBytes > 0) wanted.MaxBytes = _options.mostBytes;
    status = js_AddStream(&info, now->connection->jetStream(), &wanted, &options, &error);
    if (status == NATS_OK)
      logInfo("stream: %s is made, with %d copies", _options.name.c_str(), _options.copies);
  }
  jsStreamInfo_Destroy(info);
  if (status == NATS_OK) return "";
  const char* detail = nats_GetLastError(nullptr);
  return detail && *detail ? detail : natsStatus_GetText(status);
}

void Stream::look() {
  const std::string fault = faultOfStream();
  const bool was = _ready.exchange(fault.empty());
  if (fault != _said) {
    if (fault.empty())
      logInfo("stream: %s is ready", _options.name.c_str());
    else
      logWarning("stream: %s is not there: %s", _options.name.c_str(), fault.c_str());
  }
  _said = fault;
  if (fault.empty() && !was) _listener.back();
}

void Stream::watch() {
  for (;;) {
    attempt([this] { look(); });
    const Lock hold(_mutex);
    if (!_stopping) _changed.waitUntil(_mutex, std::chrono::steady_clock::now() + std::chrono::seconds(1));
    if (_stopping) return;
  }
}

}  // namespace veltrad::gateway
