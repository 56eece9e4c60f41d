// SPDX-License-Identifier: Apache-2.0
// Uses libpq.
#include "gateway/database.h"

#include <libpq-fe.h>

#include <algorithm>

#include "base/text.h"

namespace veltrad::gateway {

namespace {

constexpr std::size_t kCopyBytes = 1u << 20;

struct Clear {
  void operator()(PGresult* result) const { PQclear(result); }
};
using OwnedResult = std::unique_ptr<PGresult, Clear>;

std::string oneLine(const char* text) {
  std::string line(trimmed(text ? text : ""));
  std::replace(line.begin(), line.end(), '\n', ' ');
  return line.empty() ? "no reason given" : line;
}

// Classes 22 (data exception) and 23 (constraint) of SQLSTATE, and program limits (54) that the data exceeds.
StoreError errorOf(const PGresult* result, const PGconn* connection) {
  const char* state = PQresultErrorField(result, PG_DIAG_SQLSTATE);
  const std::string_view code = state ? std::string_view(state).substr(0, 2) : "";
  const bool data = code == "22" || code == "23" || code == "54";
  const char* text = PQresultErrorMessage(result);
  return {data ? StoreError::Kind::data : StoreError::Kind::passing,
          oneLine(text && *text ? text : PQerrorMessage(connection))};
}

}  // namespace

void Database::Close::operator()(pg_conn* connection) const {
  PQfinish(connection);
}

Result<std::unique_ptr<Database>, StoreError> Database::open(const std::string& dsn) {
  // What the DSN says counts more than what stands before it.
  const char* names[] = {"connect_timeout",
                         "application_name",
                         "keepalives_idle",
                         "tcp_user_timeout",
                         "client_encoding",
                         "dbname",
                         nullptr};
  const char* values[] = {"10", "veltra-gateway drain", "10", "20000", "UTF8", dsn.c_str(), nullptr};
  Connection connection(PQconnectdbParams(names, values, 1));
  if (!connection || PQstatus(connection.get()) != CONNECTION_OK)
    return Failure{StoreError{StoreError::Kind::passing, oneLine(PQerrorMessage(connection.get()))}};
  PQsetNoticeProcessor(
      connection.get(), [](void*, const char*) {}, nullptr);
  return std::unique_ptr<Database>(new Database(std::move(connection)));
}

Result<Database::Column, StoreError> Database::columnOf(pg_result* result) {
  const OwnedResult owned(result);
  const ExecStatusType status = PQresultStatus(result);
  if (status != PGRES_TUPLES_OK && status != PGRES_COMMAND_OK && status != PGRES_EMPTY_QUERY)
    return Failure{errorOf(result, _connection.get())};
  Column column;
  for (int row = 0; row < PQntuples(result); ++row)
    column.emplace_back(PQgetvalue(result, row, 0), static_cast<std::size_t>(PQgetlength(result, row, 0)));
  return column;
}

Result<Database::Column, StoreError> Database::run(const std::string& statements) {
  return columnOf(PQexec(_connection.get(), statements.c_str()));
}

Result<Database::Column, StoreError> Database::run(const std::string& statement,
                                                   const std::vector<std::string>& parameters) {
  std::vector<const char*> texts;
  for (const std::string& parameter : parameters) texts.push_back(parameter.c_str());
  return columnOf(PQexecParams(_connection.get(), statement.c_str(), static_cast<int>(texts.size()), nullptr,
                               texts.data(), nullptr, nullptr, 0));
}

Result<Done, StoreError> Database::copy(const std::string& table, std::string_view rows) {
  PGconn* connection = _connection.get();
  {
    const OwnedResult begun(PQexec(connection, ("COPY " + table + " FROM STDIN").c_str()));
    if (PQresultStatus(begun.get()) != PGRES_COPY_IN) return Failure{errorOf(begun.get(), connection)};
  }
  bool sent = true;
  for (std::size_t at = 0; at < rows.size() && sent; at += kCopyBytes) {
    const std::string_view part = rows.substr(at, kCopyBytes);
    sent = PQputCopyData(connection, part.data(), static_cast<int>(part.size())) == 1;
  }
  if (sent) sent = PQputCopyEnd(connection, nullptr) == 1;
  if (!sent) return Failure{StoreError{StoreError::Kind::passing, oneLine(PQerrorMessage(connection))}};
  Result<Done, StoreError> outcome = Done();
  while (PGresult* result = PQgetResult(connection)) {
    const OwnedResult owned(result);
    if (PQresultStatus(result) != PGRES_COMMAND_OK && outcome.ok())
      outcome = Failure{errorOf(result, connection)};
  }
  return outcome;
}

}  // namespace veltrad::gateway
