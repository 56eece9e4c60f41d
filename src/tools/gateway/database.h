// SPDX-License-Identifier: Apache-2.0
// A connection to PostgreSQL, which libpq makes. Only database.cpp includes libpq.
#pragma once

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

  // Waits for the connection, at most 10 seconds.
  static Result<std::unique_ptr<Database>, StoreError> open(const std::string& dsn);

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

  explicit Database(Connection connection) : _connection(std::move(connection)) {}
  Result<Column, StoreError> columnOf(pg_result* result);

  const Connection _connection;
};

}  // namespace veltrad::gateway
