// SPDX-License-Identifier: Apache-2.0
// Runs the transactions.
#include "gateway/table_writer.h"

#include <utility>

#include "gateway/digest.h"
#include "gateway/message.h"
#include "gateway/schema.h"

namespace veltrad::gateway {

namespace {

// The advisory lock is held as long as the connection.
constexpr const char* kTryLock =
    "SELECT pg_try_advisory_lock(hashtext('veltra-gateway drain'), hashtext($1))";
// Rows are copied when they have grown to this, all in one transaction.
constexpr std::size_t kMostRowBytes = 16u << 20;
// The limit for making an index over existing rows, and for deleting old rows.
constexpr std::chrono::minutes kLongestHousekeeping{30};

// Only digits of IDs get into statements.
bool hasPostID(const std::string& text) {
  return !text.empty() && text.size() % 2 == 0 &&
         text.find_first_not_of("0123456789abcdef") == std::string::npos;
}

}  // namespace

Result<bool, StoreError> TableWriter::becomeActive(Database& database, const std::string& stream) {
  const auto got = database.run(kTryLock, {stream});
  if (!got) return Failure{got.error()};
  return !got.value().empty() && got.value().front() == "t";
}

Result<Done, StoreError> TableWriter::prepare(Database& database) {
  const std::string mark = "veltra-gateway " + digestOf("", kSchema);
  const auto known = database.run("SELECT obj_description(to_regnamespace('veltra')::oid, 'pg_namespace')");
  if (!known) return Failure{known.error()};
  if (!known.value().empty() && known.value().front() == mark) return Done();
  return database.within(kLongestHousekeeping, [&]() -> Result<Done, StoreError> {
    const auto made = database.run(std::string(kSchema) + "COMMENT ON SCHEMA veltra IS '" + mark + "'");
    if (!made) return Failure{made.error()};
    return Done();
  });
}

Result<TableWriter::Position, StoreError> TableWriter::position(std::int64_t created) {
  const auto put = _database->run(
      "INSERT INTO veltra.position AS old (stream, created, seq, time) VALUES ($1, $2, 0, 0) "
      "ON CONFLICT (stream) DO UPDATE SET created = excluded.created, "
      "seq = CASE WHEN old.created = excluded.created THEN old.seq ELSE 0 END, "
      "time = CASE WHEN old.created = excluded.created THEN old.time ELSE 0 END RETURNING seq || ' ' || time",
      {_stream, std::to_string(created)});
  if (!put) return Failure{put.error()};
  if (put.value().empty()) return passingFailure("the position was not written");
  const std::string& found = put.value().front();
  _created = created;
  _position = std::stoull(found);
  return Position{_position, std::stoll(found.substr(found.find(' ') + 1))};
}

Result<TableWriter::Written, StoreError> TableWriter::write(const std::vector<StreamMessage>& messages) {
  if (messages.empty()) return Written();
  return writeHalves(messages.data(), messages.data() + messages.size());
}

Result<TableWriter::Written, StoreError> TableWriter::writeHalves(const StreamMessage* begin,
                                                                  const StreamMessage* end) {
  auto written = writeTogether(begin, end, "");
  if (written || written.error().kind != StoreError::Kind::data) return written;
  // One message cannot be stored: it is found in few transactions, and kept in another table.
  if (end - begin == 1) {
    written = writeTogether(begin, end, "drain: " + written.error().detail);
    if (written) written.value().refused = 1;
    return written;
  }
  const StreamMessage* middle = begin + (end - begin) / 2;
  auto first = writeHalves(begin, middle);
  if (!first) return first;
  written = writeHalves(middle, end);
  if (!written) return written;
  return Written{first.value().events + written.value().events,
                 first.value().skipped + written.value().skipped,
                 first.value().refused + written.value().refused};
}

Result<TableWriter::Written, StoreError> TableWriter::writeTogether(const StreamMessage* begin,
                                                                    const StreamMessage* end,
                                                                    const std::string& refusal) {
  if (auto begun = _database->run("BEGIN"); !begun) return Failure{begun.error()};
  const auto undo = [this](StoreError error) {
    (void)_database->run("ROLLBACK");
    _days.clear();
    return Failure{std::move(error)};
  };
  auto known = knownPosts(begin, end);
  if (!known) return undo(known.error());
  auto batch = batchOf(begin, end, std::move(known).value(), refusal);
  if (!batch) return undo(batch.error());
  if (auto synced = _files.sync(); !synced) return undo(synced.error());
  if (auto copied = copyRows(batch.value().rows); !copied) return undo(copied.error());
  const std::uint64_t seq = (end - 1)->seq;
  if (auto advanced = advance({seq, (end - 1)->time}); !advanced) return undo(advanced.error());
  if (auto committed = _database->run("COMMIT"); !committed) return Failure{committed.error()};
  _position = seq;
  for (const std::string& place : batch.value().places) _files.forget(place);
  return Written{batch.value().rows.eventCount, batch.value().skipped, 0};
}

Result<Batch, StoreError> TableWriter::batchOf(const StreamMessage* begin, const StreamMessage* end,
                                               std::set<std::string> seen, const std::string& refusal) {
  Batch batch;
  for (const StreamMessage* message = begin; message != end; ++message) {
    const bool hasID = hasPostID(message->postID);
    const bool isPiece = message->subject == subject::kPieces;
    if (!message->piece.empty() && !isPiece) batch.places.push_back(message->piece);
    if (hasID && !seen.insert(message->postID).second) {
      ++batch.skipped;
      continue;
    }
    if (!refusal.empty()) {
      batch.rows.addRefused(*message, refusal);
    } else if (auto added = add(*message, batch.rows); !added) {
      return Failure{added.error()};
    }
    if (hasID) CopyRow(batch.rows.posts).text("\\x" + message->postID).time(message->time);
    if (batch.rows.bytes() < kMostRowBytes) continue;
    if (auto copied = copyRows(batch.rows); !copied) return Failure{copied.error()};
    batch.rows.clear();
  }
  return batch;
}

Result<Done, StoreError> TableWriter::add(const StreamMessage& message, TableRows& rows) {
  const auto asData = [](Result<Done, std::string> added) -> Result<Done, StoreError> {
    if (added) return Done();
    return dataFailure(added.error());
  };
  if (message.subject == subject::kPieces) return _files.write(message.piece, message.body, message.time);
  if (message.subject == subject::kDatagrams) return asData(rows.addDatagram(message));
  if (message.subject == subject::kRefused) {
    rows.addRefused(message, message.reason);
    return Done();
  }
  if (message.subject == subject::kFiles) {
    const auto kept = _files.keep(message.piece, message.body,
                                  digestOf(message.file, std::to_string(message.seq)), message.time);
    if (!kept) return Failure{kept.error()};
    return asData(rows.addFile(message, kept.value()));
  }
  if (message.subject != subject::kEvents && message.subject != subject::kLogData)
    return dataFailure("an unknown subject: " + message.subject);
  auto body = _files.wholeOf(message.piece, message.body);
  if (!body) return Failure{body.error()};
  return asData(message.subject == subject::kEvents ? rows.addEvents(message, std::move(body).value())
                                                    : rows.addLogData(message, std::move(body).value()));
}

Result<std::set<std::string>, StoreError> TableWriter::knownPosts(const StreamMessage* begin,
                                                                  const StreamMessage* end) {
  std::string ids;
  for (const StreamMessage* message = begin; message != end; ++message) {
    if (hasPostID(message->postID)) ids += (ids.empty() ? "'\\x" : ",'\\x") + message->postID + "'::bytea";
  }
  std::set<std::string> known;
  if (ids.empty()) return known;
  auto found = _database->run("SELECT encode(id, 'hex') FROM veltra.posts WHERE id IN (" + ids + ")");
  if (!found) return Failure{found.error()};
  for (std::string& id : found.value()) known.insert(std::move(id));
  return known;
}

Result<Done, StoreError> TableWriter::copyRows(const TableRows& rows) {
  for (const std::string& day : rows.days) {
    if (_days.contains(day)) continue;
    if (auto made = _database->run("SELECT veltra.partition_for($1::date)", {day}); !made)
      return Failure{made.error()};
    _days.insert(day);
  }
  const std::pair<const char*, const std::string&> tables[] = {
      {"veltra.posts (id, received)", rows.posts},
      {"veltra.events (received, seq, index, client_id, sender, session_id, session_path, category, type, "
       "event_number, "
       "via, happened, fields)",
       rows.events},
      {"veltra.datagrams (received, seq, device_id, sender, session_id, client_version, category, type, "
       "event_number, "
       "text, fields)",
       rows.datagrams},
      {"veltra.files (received, seq, uuid, sequence, filename, description, sha256, bytes, path)",
       rows.files},
      {"veltra.log_data (received, seq, location, items)", rows.logData},
      {"veltra.refused (received, seq, reason, body)", rows.refused},
  };
  for (const auto& [table, text] : tables) {
    if (text.empty()) continue;
    if (auto copied = _database->copy(table, text); !copied) return copied;
  }
  return Done();
}

Result<Done, StoreError> TableWriter::advance(Position to) {
  // If another drain has been here, this row is not where it was left, and the transaction is undone.
  const auto moved = _database->run(
      "UPDATE veltra.position SET seq = $1, time = $2 WHERE stream = $3 AND created = $4 AND seq = $5 "
      "RETURNING seq",
      {std::to_string(to.seq), std::to_string(to.time), _stream, std::to_string(_created),
       std::to_string(_position)});
  if (!moved) return Failure{moved.error()};
  if (moved.value().size() != 1) return passingFailure("another drain has moved the position");
  return Done();
}

Result<Done, StoreError> TableWriter::goBack(std::uint64_t seq) {
  if (auto moved = advance({seq, 0}); !moved) return moved;
  _position = seq;
  return Done();
}

Result<Done, StoreError> TableWriter::forget(double postDays, double keepDays) {
  return _database->within(kLongestHousekeeping, [&] { return forgetNow(postDays, keepDays); });
}

Result<Done, StoreError> TableWriter::forgetNow(double postDays, double keepDays) {
  auto forgotten =
      _database->run("DELETE FROM veltra.posts WHERE received < now() - $1::float8 * interval '1 day'",
                     {std::to_string(postDays)});
  if (!forgotten) return Failure{forgotten.error()};
  forgotten = _database->run("DELETE FROM veltra.refused WHERE received < now() - interval '7 days'");
  if (!forgotten) return Failure{forgotten.error()};
  if (keepDays <= 0) return Done();
  forgotten =
      _database->run("SELECT veltra.forget($1::float8 * interval '1 day')", {std::to_string(keepDays)});
  if (!forgotten) return Failure{forgotten.error()};
  // A partition may be gone that comes again.
  _days.clear();
  return Done();
}

}  // namespace veltrad::gateway
