// SPDX-License-Identifier: Apache-2.0
// Uses libpq.
#include "gateway/database.h"

#include <libpq-fe.h>
#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "base/text.h"

namespace veltrad::gateway {

namespace {

constexpr std::size_t kCopyBytes = 1u << 20;

// The time that a server has to report that it cancelled a statement.
constexpr std::chrono::milliseconds kMostGrace{10'000};

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

void Database::Clear::operator()(pg_result* result) const {
  PQclear(result);
}

Result<std::unique_ptr<Database>, StoreError> Database::open(const std::string& dsn,
                                                             std::chrono::milliseconds longest) {
  // Settings in the DSN override those before it.
  const std::pair<const char*, const char*> settings[] = {
      {"connect_timeout", "10"},   {"application_name", "veltra-gateway drain"},
      {"keepalives_idle", "10"},   {"keepalives_interval", "5"},
      {"keepalives_count", "3"},   {"tcp_user_timeout", "20000"},
      {"client_encoding", "UTF8"}, {"dbname", dsn.c_str()},
      {nullptr, nullptr},
  };
  std::vector<const char*> names, values;
  for (const auto& [name, value] : settings) {
    names.push_back(name);
    values.push_back(value);
  }
  Connection connection(PQconnectdbParams(names.data(), values.data(), 1));
  if (!connection || PQstatus(connection.get()) != CONNECTION_OK ||
      PQsetnonblocking(connection.get(), 1) != 0)
    return Failure{StoreError{StoreError::Kind::passing, oneLine(PQerrorMessage(connection.get()))}};
  PQsetNoticeProcessor(
      connection.get(), [](void*, const char*) {}, nullptr);
  std::unique_ptr<Database> made(new Database(std::move(connection)));
  if (auto set = made->setLongest(longest); !set) return Failure{set.error()};
  return made;
}

Result<Done, StoreError> Database::setLongest(std::chrono::milliseconds longest) {
  _longest = longest;
  const auto set = run("SET statement_timeout = " + std::to_string(longest.count()));
  if (!set) return Failure{set.error()};
  return Done();
}

Result<Done, StoreError> Database::within(std::chrono::milliseconds longest,
                                          const std::function<Result<Done, StoreError>()>& work) {
  const auto usual = _longest;
  if (auto set = setLongest(longest); !set) return set;
  auto done = work();
  if (auto set = setLongest(usual); done && !set) return set;
  return done;
}

StoreError Database::lost() const {
  return {StoreError::Kind::passing, oneLine(PQerrorMessage(_connection.get()))};
}

void Database::begin() {
  _deadline = std::chrono::steady_clock::now() + _longest + std::min(_longest, kMostGrace);
}

Result<Done, StoreError> Database::await(short events) {
  const int socket = PQsocket(_connection.get());
  if (socket < 0) return Failure{lost()};
  for (;;) {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(_deadline - std::chrono::steady_clock::now());
    pollfd watched{socket, events, 0};
    const int ready = left.count() > 0 ? ::poll(&watched, 1, static_cast<int>(left.count())) : 0;
    if (ready > 0) return Done();
    if (ready < 0 && errno == EINTR) continue;
    // The server learns it as soon as it can, and the library in every further call.
    ::shutdown(socket, SHUT_RDWR);
    return passingFailure("the database does not answer");
  }
}

Result<Done, StoreError> Database::flush() {
  for (;;) {
    const int left = PQflush(_connection.get());
    if (left == 0) return Done();
    if (left < 0) return Failure{lost()};
    if (auto awaited = await(POLLIN | POLLOUT); !awaited) return awaited;
    if (PQconsumeInput(_connection.get()) != 1) return Failure{lost()};
  }
}

Result<Database::OwnedResult, StoreError> Database::finish(int sent) {
  if (sent != 1) return Failure{lost()};
  if (auto flushed = flush(); !flushed) return Failure{flushed.error()};
  OwnedResult last;
  for (;;) {
    while (PQisBusy(_connection.get()) != 0) {
      if (auto awaited = await(POLLIN); !awaited) return Failure{awaited.error()};
      if (PQconsumeInput(_connection.get()) != 1) return Failure{lost()};
    }
    OwnedResult next(PQgetResult(_connection.get()));
    if (!next) break;
    last = std::move(next);
    if (PQresultStatus(last.get()) == PGRES_COPY_IN) break;
  }
  if (!last) return Failure{lost()};
  return last;
}

Result<Database::Column, StoreError> Database::columnOf(int sent) {
  auto finished = finish(sent);
  if (!finished) return Failure{finished.error()};
  const PGresult* result = finished.value().get();
  const ExecStatusType status = PQresultStatus(result);
  if (status != PGRES_TUPLES_OK && status != PGRES_COMMAND_OK && status != PGRES_EMPTY_QUERY)
    return Failure{errorOf(result, _connection.get())};
  Column column;
  for (int row = 0; row < PQntuples(result); ++row)
    column.emplace_back(PQgetvalue(result, row, 0), static_cast<std::size_t>(PQgetlength(result, row, 0)));
  return column;
}

Result<Database::Column, StoreError> Database::run(const std::string& statements) {
  begin();
  return columnOf(PQsendQuery(_connection.get(), statements.c_str()));
}

Result<Database::Column, StoreError> Database::run(const std::string& statement,
                                                   const std::vector<std::string>& parameters) {
  std::vector<const char*> texts;
  texts.reserve(parameters.size());
  for (const std::string& parameter : parameters) texts.push_back(parameter.c_str());
  begin();
  return columnOf(PQsendQueryParams(_connection.get(), statement.c_str(), static_cast<int>(texts.size()),
                                    nullptr, texts.data(), nullptr, nullptr, 0));
}

Result<Done, StoreError> Database::copy(const std::string& table, std::string_view rows) {
  PGconn* connection = _connection.get();
  begin();
  const auto begun = finish(PQsendQuery(connection, ("COPY " + table + " FROM STDIN").c_str()));
  if (!begun) return Failure{begun.error()};
  if (PQresultStatus(begun.value().get()) != PGRES_COPY_IN)
    return Failure{errorOf(begun.value().get(), connection)};
  for (; !rows.empty(); rows.remove_prefix(std::min(kCopyBytes, rows.size()))) {
    const std::string_view part = rows.substr(0, kCopyBytes);
    if (PQputCopyData(connection, part.data(), static_cast<int>(part.size())) != 1) return Failure{lost()};
    if (auto flushed = flush(); !flushed) return flushed;
  }
  const auto copied = finish(PQputCopyEnd(connection, nullptr));
  if (!copied) return Failure{copied.error()};
  if (PQresultStatus(copied.value().get()) != PGRES_COMMAND_OK)
    return Failure{errorOf(copied.value().get(), connection)};
  return Done();
}

}  // namespace veltrad::gateway
