// SPDX-License-Identifier: Apache-2.0
// Pulls from an ephemeral consumer that wants no acknowledgements; the database says what was read.
#include "gateway/stream_reader.h"

#include <nats/nats.h>

#include <fmt/format.h>

#include "gateway/message.h"

namespace veltrad::gateway {

namespace {

constexpr std::int64_t kWaitNanoseconds = 1'000'000'000;
// A message has at most 8 MiB, see fleet/stream.conf.
constexpr std::int64_t kMostBytesAtOnce = 32 << 20;
constexpr std::int64_t kReaderMilliseconds = 3'000;
constexpr std::int64_t kInactiveNanoseconds = 60'000'000'000;

std::string failureOf(const char* what, natsStatus status, jsErrCode error) {
  return fmt::format("{}: {}, error {}", what, natsStatus_GetText(status), static_cast<int>(error));
}

std::string headerOf(natsMsg* message, const char* name) {
  const char* text = nullptr;
  return natsMsgHeader_Get(message, name, &text) == NATS_OK && text ? text : "";
}

jsOptions answerWithin(std::int64_t milliseconds) {
  jsOptions options;
  jsOptions_Init(&options);
  options.Wait = milliseconds;
  return options;
}

struct FreeMetaData {
  void operator()(jsMsgMetaData* data) const { jsMsgMetaData_Destroy(data); }
};

struct MessageList : natsMsgList {
  MessageList() : natsMsgList{} {}
  ~MessageList() { natsMsgList_Destroy(this); }
};

}  // namespace

Result<std::unique_ptr<StreamReader>, std::string> StreamReader::open(StreamOptions options) {
  std::unique_ptr<StreamReader> self(new StreamReader(std::move(options)));
  auto connection = NATSConnection::open(self->_options, nullptr);
  if (!connection) return Failure{std::move(connection.error())};
  self->_connection = std::move(connection).value();
  return self;
}

StreamReader::~StreamReader() {
  leaveConsumer();
}

void StreamReader::leaveConsumer() {
  if (!_subscription) return;
  natsSubscription_Unsubscribe(_subscription);
  natsSubscription_Destroy(_subscription);
  _subscription = nullptr;
}

Result<StreamState, std::string> StreamReader::state() {
  jsOptions options = answerWithin(kReaderMilliseconds);
  jsStreamInfo* info = nullptr;
  jsErrCode error = static_cast<jsErrCode>(0);
  const natsStatus status =
      js_GetStreamInfo(&info, _connection->jetStream(), _options.name.c_str(), &options, &error);
  if (status != NATS_OK) return Failure{failureOf("the stream does not answer", status, error)};
  const StreamState state{info->Created, info->State.FirstSeq, info->State.LastSeq};
  jsStreamInfo_Destroy(info);
  return state;
}

Result<Done, std::string> StreamReader::startBehind(std::uint64_t seq) {
  leaveConsumer();
  _delivered = 0;
  jsOptions options = answerWithin(kReaderMilliseconds);
  jsSubOptions wanted;
  jsSubOptions_Init(&wanted);
  wanted.Stream = _options.name.c_str();
  wanted.ManualAck = true;
  wanted.Config.DeliverPolicy = js_DeliverByStartSequence;
  wanted.Config.OptStartSeq = seq + 1;
  wanted.Config.AckPolicy = js_AckNone;
  wanted.Config.InactiveThreshold = kInactiveNanoseconds;
  wanted.Config.MemoryStorage = true;
  wanted.Config.Replicas = 1;
  jsErrCode error = static_cast<jsErrCode>(0);
  const std::string all = _options.prefix + ">";
  const natsStatus status = js_PullSubscribe(&_subscription, _connection->jetStream(), all.c_str(), nullptr,
                                             &options, &wanted, &error);
  if (status != NATS_OK) return Failure{failureOf("no consumer can be made", status, error)};
  return Done();
}

Result<std::vector<StreamMessage>, std::string> StreamReader::read(int most) {
  MessageList list;
  jsFetchRequest wanted;
  jsFetchRequest_Init(&wanted);
  wanted.Batch = most;
  wanted.MaxBytes = kMostBytesAtOnce;
  wanted.Expires = kWaitNanoseconds;
  const natsStatus status = natsSubscription_FetchRequest(&list, _subscription, &wanted);
  if (status == NATS_TIMEOUT && _connection->connected()) return std::vector<StreamMessage>();
  if (status != NATS_OK)
    return Failure{failureOf("the stream cannot be read", status, static_cast<jsErrCode>(0))};
  std::vector<StreamMessage> taken;
  taken.reserve(static_cast<std::size_t>(list.Count));
  for (int at = 0; at < list.Count; ++at) {
    if (auto fault = add(list.Msgs[at], taken)) return Failure{std::move(*fault)};
  }
  return taken;
}

std::optional<std::string> StreamReader::add(natsMsg* message, std::vector<StreamMessage>& taken) {
  jsMsgMetaData* found = nullptr;
  if (natsMsg_GetMetaData(&found, message) != NATS_OK) return "a message without its place in the stream";
  const std::unique_ptr<jsMsgMetaData, FreeMetaData> data(found);
  // Delivered messages that did not arrive are not delivered again.
  if (data->Sequence.Consumer != _delivered + 1)
    return fmt::format("delivery {} came behind delivery {}", data->Sequence.Consumer, _delivered);
  _delivered = data->Sequence.Consumer;
  _behind = data->NumPending;
  StreamMessage one;
  one.seq = data->Sequence.Stream;
  one.time = data->Timestamp;
  one.subject = std::string(natsMsg_GetSubject(message)).substr(_options.prefix.size());
  one.postID = headerOf(message, header::kPostID);
  one.via = headerOf(message, header::kVia);
  one.reason = headerOf(message, header::kReason);
  one.location = headerOf(message, header::kLocation);
  one.file = headerOf(message, header::kFile);
  one.piece = headerOf(message, header::kPiece);
  one.body.assign(natsMsg_GetData(message), static_cast<std::size_t>(natsMsg_GetDataLength(message)));
  taken.push_back(std::move(one));
  return std::nullopt;
}

Result<std::optional<std::int64_t>, std::string> StreamReader::timeAt(std::uint64_t seq) {
  jsOptions options = answerWithin(kReaderMilliseconds);
  jsErrCode error = static_cast<jsErrCode>(0);
  natsMsg* message = nullptr;
  const natsStatus status =
      js_GetMsg(&message, _connection->jetStream(), _options.name.c_str(), seq, &options, &error);
  if (status == NATS_NOT_FOUND) return std::optional<std::int64_t>();
  if (status != NATS_OK) return Failure{failureOf("a message cannot be looked at", status, error)};
  const std::int64_t time = natsMsg_GetTime(message);
  natsMsg_Destroy(message);
  return std::optional(time);
}

Result<Done, std::string> StreamReader::purge(std::uint64_t seq) {
  jsOptions options = answerWithin(kReaderMilliseconds);
  options.Stream.Purge.Sequence = seq + 1;
  jsErrCode error = static_cast<jsErrCode>(0);
  const natsStatus status = js_PurgeStream(_connection->jetStream(), _options.name.c_str(), &options, &error);
  if (status != NATS_OK) return Failure{failureOf("the stream cannot be purged", status, error)};
  return Done();
}

}  // namespace veltrad::gateway
