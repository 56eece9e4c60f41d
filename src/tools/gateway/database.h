// SPDX-License-Identifier: Apache-2.0
// A connection to PostgreSQL, which libpq makes. Only database.cpp includes libpq.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "gateway/store_error.h"

struct pg_conn;
struct pg_result;

namespace veltrad::gateway {

// Used by one thread.
class Database {
 public:
  // The texts of a result's first column; of rows that are null, empty.
  using Column = std::vector<std::string>;

  // Waits for the connection, at most 10 seconds for each address. A statement has `longest`, and after that
  // the server as long again, but 10 seconds at most, to say so: a server that does not even do that has lost
  // the connection, and every further call fails.
  static Result<std::unique_ptr<Database>, StoreError> open(const std::string& dsn,
                                                            std::chrono::milliseconds longest);

  // Runs `work`, in which a statement has so long instead.
  Result<Done, StoreError> within(std::chrono::milliseconds longest,
                                  const std::function<Result<Done, StoreError>()>& work);
  // One or several statements without parameters.
  Result<Column, StoreError> run(const std::string& statements);
  // One statement with parameters $1, $2…
  Result<Column, StoreError> run(const std::string& statement, const std::vector<std::string>& parameters);
  // Rows in COPY's text format into `table`, which names its columns: "veltra.posts (id, received)".
  Result<Done, StoreError> copy(const std::string& table, std::string_view rows);

 private:
  struct Close {
    void operator()(pg_conn* connection) const;
  };
  using Connection = std::unique_ptr<pg_conn, Close>;
  struct Clear {
    void operator()(pg_result* result) const;
  };
  using OwnedResult = std::unique_ptr<pg_result, Clear>;

  explicit Database(Connection connection) : _connection(std::move(connection)) {}
  Result<Done, StoreError> setLongest(std::chrono::milliseconds longest);
  // Sets the deadline for the following calls.
  void begin();
  Result<Done, StoreError> await(short events);
  Result<Done, StoreError> flush();
  // The last result of what was sent; a copy that begins is one.
  Result<OwnedResult, StoreError> finish(int sent);
  Result<Column, StoreError> columnOf(int sent);
  StoreError lost() const;

  const Connection _connection;
  std::chrono::milliseconds _longest{};
  std::chrono::steady_clock::time_point _deadline;
};

}  // namespace veltrad::gateway
