// SPDX-License-Identifier: Apache-2.0
// Writes batches of messages to the tables, each batch with the place in the stream in one transaction.
#pragma once

#include <cstdint>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "base/result.h"
#include "gateway/database.h"
#include "gateway/piece_store.h"
#include "gateway/table_rows.h"

namespace veltrad::gateway {

// A batch under construction: its rows, and the work after its commit.
struct Batch {
  TableRows rows;
  // The pieces that are not needed any more.
  std::vector<std::string> places;
  std::uint64_t skipped = 0;
};

// Used by one thread. The folder must outlive it.
class TableWriter {
 public:
  struct Written {
    std::uint64_t events = 0;
    // Posts that the tables had already.
    std::uint64_t skipped = 0;
    // Messages that no table can take, which are in "refused" now.
    std::uint64_t refused = 0;
  };

  // Makes this the active drain of the stream; false if another drain is active.
  static Result<bool, StoreError> becomeActive(Database& database, const std::string& stream);
  // Makes what is missing of tables and views, unless this version of them is there: a statement that
  // replaces a view would wait for every query of it, and let others wait meanwhile.
  static Result<Done, StoreError> prepare(Database& database);

  TableWriter(std::unique_ptr<Database> database, PieceStore& files, std::string stream)
      : _database(std::move(database)), _files(files), _stream(std::move(stream)) {}

  // Everything up to this place of the stream is in the tables.
  struct Position {
    std::uint64_t seq = 0;
    // Of the message at this place, in nanoseconds since 1970; 0: unknown.
    std::int64_t time = 0;
  };

  // A stream that was made at another time begins at 0.
  Result<Position, StoreError> position(std::int64_t created);
  // Sets the position back to `seq`, because new messages of the stream get the places after it.
  Result<Done, StoreError> goBack(std::uint64_t seq);
  // After an error nothing is written, unless the error came with the commit: ask for the position then.
  Result<Written, StoreError> write(const std::vector<StreamMessage>& messages);
  // Deletes older data: IDs of posts, and everything else unless `keepDays` is 0.
  Result<Done, StoreError> forget(double postDays, double keepDays);

 private:
  Result<Written, StoreError> writeHalves(const StreamMessage* begin, const StreamMessage* end);
  // With a refusal the messages go to "refused" for this reason.
  Result<Written, StoreError> writeTogether(const StreamMessage* begin, const StreamMessage* end,
                                            const std::string& refusal);
  Result<Batch, StoreError> batchOf(const StreamMessage* begin, const StreamMessage* end,
                                    std::set<std::string> seen, const std::string& refusal);
  Result<Done, StoreError> add(const StreamMessage& message, TableRows& rows);
  Result<std::set<std::string>, StoreError> knownPosts(const StreamMessage* begin, const StreamMessage* end);
  Result<Done, StoreError> copyRows(const TableRows& rows);
  Result<Done, StoreError> advance(Position to);
  Result<Done, StoreError> forgetNow(double postDays, double keepDays);

  const std::unique_ptr<Database> _database;
  PieceStore& _files;
  const std::string _stream;
  std::int64_t _created = 0;
  std::uint64_t _position = 0;
  std::set<std::string> _days;
};

}  // namespace veltrad::gateway
