// SPDX-License-Identifier: Apache-2.0
// Escapes as COPY's text format wants it.
#include "gateway/table_rows.h"

#include <fmt/format.h>

#include <cmath>
#include <ctime>

#include "base/text.h"
#include "formats/json.h"
#include "gateway/clean_json.h"
#include "tools/dashboard_packet.h"

namespace veltrad::gateway {

namespace {

constexpr std::int64_t kNanosecondsOfSecond = 1'000'000'000;
constexpr std::size_t kMostRefusedBytes = 64u << 10;

std::string withoutNUL(std::string_view text) {
  std::string out;
  for (const char c : text) out += c == '\0' ? std::string("\xef\xbf\xbd") : std::string(1, c);
  return out;
}

std::string textIn(const Dictionary& fields, std::string_view key) {
  const std::string* text = fields.string(key);
  return text ? withoutNUL(*text) : "";
}

std::int64_t numberIn(const Dictionary& fields, std::string_view key) {
  const Value* value = fields.find(key);
  return value ? value->toInt64().value_or(0) : 0;
}

}  // namespace

std::string timestampText(std::int64_t nanoseconds) {
  const std::time_t seconds = nanoseconds / kNanosecondsOfSecond;
  std::tm parts{};
  ::gmtime_r(&seconds, &parts);
  return fmt::format("{:04}-{:02}-{:02} {:02}:{:02}:{:02}.{:06}+00", parts.tm_year + 1900, parts.tm_mon + 1,
                     parts.tm_mday, parts.tm_hour, parts.tm_min, parts.tm_sec,
                     nanoseconds % kNanosecondsOfSecond / 1'000);
}

std::string dayText(std::int64_t nanoseconds) {
  return timestampText(nanoseconds).substr(0, 10);
}

void CopyRow::begin() {
  if (!_first) _out += '\t';
  _first = false;
}

CopyRow& CopyRow::text(std::string_view text) {
  begin();
  for (const char c : text) {
    switch (c) {
      case '\\':
        _out += "\\\\";
        break;
      case '\t':
        _out += "\\t";
        break;
      case '\n':
        _out += "\\n";
        break;
      case '\r':
        _out += "\\r";
        break;
      default:
        _out += c;
    }
  }
  return *this;
}

CopyRow& CopyRow::number(std::int64_t number) {
  begin();
  _out += std::to_string(number);
  return *this;
}

CopyRow& CopyRow::time(std::int64_t nanoseconds) {
  begin();
  _out += timestampText(nanoseconds);
  return *this;
}

CopyRow& CopyRow::bytes(std::string_view bytes) {
  begin();
  _out += "\\\\x";
  _out += hex(bytes);
  return *this;
}

CopyRow& CopyRow::texts(const std::vector<std::string>& texts) {
  std::string array = "{";
  for (const std::string& one : texts) {
    array += array.size() > 1 ? ",\"" : "\"";
    for (const char c : one) {
      if (c == '"' || c == '\\') array += '\\';
      array += c;
    }
    array += '"';
  }
  return text(array + "}");
}

CopyRow& CopyRow::null() {
  begin();
  _out += "\\N";
  return *this;
}

std::size_t TableRows::bytes() const {
  return events.size() + datagrams.size() + files.size() + logData.size() + refused.size() + posts.size();
}

void TableRows::clear() {
  // The memory goes, too; an assignment would keep it.
  for (std::string* rows : {&events, &datagrams, &files, &logData, &refused, &posts})
    std::string().swap(*rows);
}

Result<Done, std::string> TableRows::addEvents(const StreamMessage& message, std::string body) {
  const auto envelope = parseEnvelope(std::move(body));
  if (!envelope) return Failure{envelope.error()};
  std::int64_t index = 0;
  for (const Dictionary& event : envelope.value().events) {
    const EventColumns columns = columnsOf(event);
    CopyRow row(events);
    row.time(message.time).number(static_cast<std::int64_t>(message.seq)).number(index++);
    row.text(envelope.value().clientID).textIf(columns.sender).textIf(columns.sessionID);
    columns.sessionPath.empty() ? row.null() : row.texts(columns.sessionPath);
    row.numberIf(columns.category).numberIf(columns.type).numberIf(columns.eventNumber);
    message.via.empty() ? row.null() : row.text(message.via);
    columns.happened ? row.time(std::llround(*columns.happened * 1e6) * 1'000) : row.null();
    row.text(formats::writeJSON(event));
  }
  eventCount += envelope.value().events.size();
  if (index > 0) days.insert(dayText(message.time));
  return Done();
}

Result<Done, std::string> TableRows::addDatagram(const StreamMessage& message) {
  const auto parsed = parseCleanJSON(message.body);
  const Dictionary* fields = parsed ? parsed.value().asDictionary() : nullptr;
  const std::string* text = fields ? fields->string("text") : nullptr;
  if (!text) return Failure{std::string("it is no datagram")};
  CopyRow row(datagrams);
  row.time(message.time).number(static_cast<std::int64_t>(message.seq));
  row.text(textIn(*fields, "deviceID")).text(textIn(*fields, "sender"));
  for (const char* key : {"sessionID", "clientVersion", "category", "type", "eventNumber"})
    row.number(numberIn(*fields, key));
  row.text(*text).text(formats::writeJSON(tools::itemsOfText(*text)));
  return Done();
}

Result<Done, std::string> TableRows::addLogData(const StreamMessage& message, std::string body) {
  if (message.location.empty()) return Failure{std::string("log data without a location")};
  CopyRow(logData)
      .time(message.time)
      .number(static_cast<std::int64_t>(message.seq))
      .text(message.location)
      .text(withWholeCharacters(std::move(body)));
  return Done();
}

Result<Done, std::string> TableRows::addFile(const StreamMessage& message, const std::string& path) {
  const auto parsed = parseCleanJSON(message.file);
  const Dictionary* file = parsed ? parsed.value().asDictionary() : nullptr;
  if (!file) return Failure{std::string("a file without its description")};
  CopyRow row(files);
  row.time(message.time).number(static_cast<std::int64_t>(message.seq)).text(textIn(*file, "uuid"));
  row.text(textIn(*file, "sequence")).text(textIn(*file, "filename")).text(textIn(*file, "description"));
  row.text("\\x" + textIn(*file, "sha256")).number(numberIn(*file, "bytes")).text(path);
  return Done();
}

void TableRows::addRefused(const StreamMessage& message, const std::string& reason) {
  CopyRow(refused)
      .time(message.time)
      .number(static_cast<std::int64_t>(message.seq))
      .text(withoutNUL(toUTF8(reason)))
      .bytes(std::string_view(message.body).substr(0, kMostRefusedBytes));
}

}  // namespace veltrad::gateway
