// SPDX-License-Identifier: Apache-2.0
// Handles requests on the threads of the HTTP library, which only this file includes.
#include "server.h"

#include <httplib.h>

#include <charconv>
#include <thread>

#include "answers.h"
#include "base/text.h"
#include "connections.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "page.h"
#include "post_ids.h"
#include "upload_digest.h"

namespace veltrad::lab {
namespace {

using httplib::ContentReader;
using httplib::Request;
using httplib::Response;

constexpr std::size_t kMostBodyBytes = 64u << 20;
constexpr std::size_t kMostUploadBytes = 2u << 30;
constexpr PropertyListLimits kLogDataLimits{kMostBodyBytes, 64, 500'000, kMostBodyBytes};
// Each open connection holds one.
constexpr std::size_t kThreads = 64;
constexpr std::size_t kPieceBytes = 64u << 10;
constexpr std::chrono::milliseconds kLongestWait{60'000};
constexpr const char* kPlainText = "text/plain; charset=utf-8";

// Without those that the library adds.
Dictionary headersOf(const Request& request) {
  Dictionary headers;
  for (const auto& [name, text] : request.headers) {
    if (name == "REMOTE_ADDR" || name == "REMOTE_PORT" || name == "LOCAL_ADDR" || name == "LOCAL_PORT")
      continue;
    const std::string* before = headers.string(name);
    headers.set(name, before ? *before + ", " + toUTF8(text) : toUTF8(text));
  }
  return headers;
}

Dictionary arrival(const Request& request) {
  return {{"time", secondsNow()},
          {"path", toUTF8(request.target)},
          {"method", request.method},
          {"headers", headersOf(request)}};
}

std::string outcome(const std::optional<Rule>& rule, const Answer& answer) {
  if (rule && rule->stall) return "stalled";
  if (rule && rule->cut) return "cut";
  return std::to_string(answer.status);
}

std::uint64_t numberOf(const Request& request, const char* parameter) {
  const std::string text = request.get_param_value(parameter);
  std::uint64_t number = 0;
  std::from_chars(text.data(), text.data() + text.size(), number);
  return number;
}

void refuse(Response& response, int status, const std::string& why) {
  response.status = status;
  response.set_content(why + "\n", kPlainText);
}

// Ends the connection after `sent` bytes of the body, because the library closes it when a provider fails.
void sendAndEnd(Response& response, const std::string& body, std::size_t sent, const std::string& type) {
  response.set_content_provider(
      std::max<std::size_t>(body.size(), 1), type,
      [part = body.substr(0, sent)](std::size_t, std::size_t, httplib::DataSink& sink) {
        sink.write(part.data(), part.size());
        return false;
      });
}

void refuseAndEnd(Response& response, int status, const std::string& why) {
  response.status = status;
  sendAndEnd(response, why, why.size(), kPlainText);
}

bool isBelow(std::string_view path, std::string_view top) {
  return path.starts_with(top) && (path.size() == top.size() || path[top.size()] == '/');
}

Dictionary queryOf(const Request& request) {
  Dictionary query;
  for (const auto& [name, text] : request.params) query.set(toUTF8(name), toUTF8(text));
  return query;
}

}  // namespace

struct Server::Library {
  explicit Library(Server& server)
      : lab(server), http([this](SSL_CTX& context) { return useCertificate(context); }) {}

  bool useCertificate(SSL_CTX& context) {
    connections.watch(context);
    return SSL_CTX_set_min_proto_version(&context, TLS1_2_VERSION) == 1 &&
           SSL_CTX_use_certificate_chain_file(&context, lab._directory.certificatePath().c_str()) == 1 &&
           SSL_CTX_use_PrivateKey_file(&context, lab._directory.certificateKeyPath().c_str(),
                                       SSL_FILETYPE_PEM) == 1 &&
           SSL_CTX_check_private_key(&context) == 1;
  }

  void route() {
    http.new_task_queue = [] { return new httplib::ThreadPool(kThreads); };
    http.set_keep_alive_max_count(1'000'000'000);
    http.set_keep_alive_timeout(60);
    // The handlers check smaller bounds.
    http.set_payload_max_length(kMostUploadBytes);
    http.set_tcp_nodelay(true);
    // By default the library would let a second lab share the port.
    http.set_socket_options([](socket_t socket) {
      const int yes = 1;
      ::setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes);
    });
    http.set_exception_handler([](const Request&, Response& response, const std::exception_ptr&) {
      refuse(response, 500, "the lab could not handle this request");
    });
    http.Get("/", [this](const Request&, Response& response) {
      response.set_content(livePage({lab._url, "Log data: " + lab.logDataURL(), "Uploads: " + lab.uploadURL(),
                                     "Dashboard: 127.0.0.1, UDP port " + std::to_string(lab.dashboardPort())},
                                    lab._arrivals),
                           "text/html; charset=utf-8");
    });
    http.Get("/doubles", [this](const Request&, Response& response) {
      response.set_content(formats::writeJSON(postIDs.doubles()), "application/json");
    });
    http.Get("/received",
             [this](const Request& request, Response& response) { received(request, response); });
    http.Get("/.+", [this](const Request& request, Response& response) { storebag(request, response); });
    const auto collector = [this](const Request& request, Response& response, const ContentReader& reader) {
      post(request, response, reader);
    };
    http.Post("/.*", collector);
    http.Put("/.*", collector);
    http.Delete("/control", [this](const Request&, Response& response) {
      lab._misbehaviour.reset();
      response.set_content("{}", "application/json");
    });
  }

  void storebag(const Request& request, Response& response) {
    const std::string name = request.path.substr(request.path.rfind('/') + 1);
    const auto rule = lab._misbehaviour.take(request.path);
    const auto file = lab._directory.storebag(name, lab._url, lab.dashboardPort());
    if (!file && file.error().kind == StorebagFailure::Kind::unreadable)
      std::fprintf(stderr, "veltra-lab: %s\n", file.error().description.c_str());
    Answer answer = file ? answerWithStorebag(file.value(), lab._directory, rule, lab._maxAge,
                                              request.get_header_value("If-Modified-Since"))
                         : answerWithFailure(file.error());
    if (rule) applyRule(*rule, answer);
    Dictionary line = arrival(request);
    line.set("name", toUTF8(name));
    finish(request, response, answer, rule, lab._arrivals.storebags, std::move(line));
  }

  void post(const Request& request, Response& response, const ContentReader& reader) {
    if (isBelow(request.path, kUploadPath)) return upload(request, response, reader);
    // Decompressed by the library.
    std::string body;
    const bool whole = reader([&body](const char* bytes, std::size_t length) {
      if (body.size() + length > kMostBodyBytes) return false;
      body.append(bytes, length);
      return true;
    });
    if (!whole) {
      // Otherwise the rest of the body would be read as the next request.
      const bool tooLarge = response.status == 413 || body.size() + kPieceBytes > kMostBodyBytes;
      return refuseAndEnd(response, tooLarge ? 413 : 400,
                          tooLarge ? "a body has at most 64 MiB\n" : "the body is cut short or is no gzip\n");
    }
    if (request.path == "/control") return control(response, body);
    if (isBelow(request.path, kLogDataPath)) return logData(request, response, body);
    collect(request, response, body);
  }

  void collect(const Request& request, Response& response, const std::string& body) {
    const auto rule = lab._misbehaviour.take(request.path);
    Answer answer;
    answer.body = "{}";
    if (rule) applyRule(*rule, answer);
    Dictionary line = arrival(request);
    if (const std::string id = request.get_header_value("X-VLT-Post-ID"); !id.empty())
      line.set("double", postIDs.add(toUTF8(id)));
    const std::string length = request.get_header_value("Content-Length");
    line.set("compressed", request.get_header_value("Content-Encoding") == "gzip");
    line.set("bytes", length.empty() ? std::uint64_t{body.size()}
                                     : std::uint64_t{std::strtoull(length.c_str(), nullptr, 10)});
    finish(request, response, answer, rule, lab._arrivals.events, std::move(line), bodyAsJSON(body));
  }

  // Answers with the location where the array is said to be stored.
  void logData(const Request& request, Response& response, const std::string& body) {
    const auto rule = lab._misbehaviour.take(request.path);
    Answer answer;
    answer.type = kPlainText;
    answer.body = "/logs/" + std::to_string(++storedLogData);
    if (rule) applyRule(*rule, answer);
    Dictionary line = arrival(request);
    line.set("bytes", std::uint64_t{body.size()});
    line.set("answer", toUTF8(answer.body));
    const auto archive = formats::parsePropertyList(body, kLogDataLimits);
    if (!archive) line.set("problem", archive.error().detail);
    finish(request, response, answer, rule, lab._arrivals.logData, std::move(line),
           archive ? formats::writeJSON(archive.value()) : bodyAsJSON(body));
  }

  void upload(const Request& request, Response& response, const ContentReader& reader) {
    Dictionary line = arrival(request);
    // Otherwise the library would decompress the body. The request object itself is not constant.
    const_cast<Request&>(request).headers.erase("Content-Encoding");
    UploadDigest digest;
    const bool whole = reader([&digest](const char* bytes, std::size_t length) {
      digest.add({bytes, length});
      return true;
    });
    if (!whole) {
      const bool tooLarge = response.status == 413;
      return refuseAndEnd(response, tooLarge ? 413 : 400,
                          tooLarge ? "an upload has at most 2 GiB\n" : "the upload is cut short\n");
    }
    const auto rule = lab._misbehaviour.take(request.path);
    Answer answer;
    answer.body = "{\"success\": true}";
    if (rule) applyRule(*rule, answer);
    line.set("query", queryOf(request));
    line.merge(digest.finish());
    finish(request, response, answer, rule, lab._arrivals.uploads, std::move(line));
  }

  void control(Response& response, const std::string& body) {
    auto rule = ruleFromJSON(body);
    if (!rule) return refuse(response, 400, rule.error());
    lab._misbehaviour.add(std::move(rule).value());
    response.set_content("{}", "application/json");
  }

  // ?kind=events; with &count=N&waitMs=M it waits for N lines, at most M milliseconds.
  void received(const Request& request, Response& response) {
    const std::string kind = request.get_param_value("kind");
    const auto kinds = lab._arrivals.kinds();
    const auto found =
        std::find_if(kinds.begin(), kinds.end(), [&](const auto& one) { return one.name == kind; });
    if (found == kinds.end())
      return refuse(response, 400, "kind: expected events, storebags, dashboard, logdata or uploads");
    Received& lines = found->lines;
    const auto wait = std::min<std::uint64_t>(numberOf(request, "waitMs"), kLongestWait.count());
    lines.waitFor(numberOf(request, "count"), std::chrono::milliseconds(wait));
    const std::uint64_t first = lines.firstByte();
    const std::uint64_t length = lines.endByte() - first;
    if (length == 0) return response.set_content("", "application/x-ndjson");
    response.set_content_provider(
        length, "application/x-ndjson",
        [&lines, first](std::size_t offset, std::size_t most, httplib::DataSink& sink) {
          const auto bytes = lines.read(first + offset, std::min(most, kPieceBytes));
          return !bytes.empty() && sink.write(bytes.data(), bytes.size());
        });
  }

  // Records the arrival, then answers it.
  void finish(const Request& request, Response& response, const Answer& answer,
              const std::optional<Rule>& rule, Received& lines, Dictionary line,
              const std::string& body = {}) {
    line.set("outcome", outcome(rule, answer));
    lines.add(line, body);
    response.status = answer.status;
    if (rule && rule->delay.count() > 0) lab._misbehaviour.hold(rule->generation, rule->delay);
    if (rule && rule->stall) lab._misbehaviour.hold(rule->generation, std::nullopt);
    if (rule && (rule->cut || (rule->stall && lab._misbehaviour.stopped())))
      return Connections::cut(request.ssl);
    for (const auto& [name, text] : answer.headers) response.set_header(name, text.toText().value_or(""));
    if (rule && rule->endless) return sendEndless(response, *rule, answer.type);
    if (rule && rule->cutHalfway)
      return sendAndEnd(response, answer.body, answer.body.size() / 2, answer.type);
    if (answer.body.empty()) return;
    if (rule && rule->drip) return sendDripping(response, *rule, answer);
    response.set_content(answer.body, answer.type);
  }

  void sendEndless(Response& response, const Rule& rule, const std::string& type) {
    response.set_chunked_content_provider(
        type, [this, piece = std::string(kPieceBytes, 'x'), generation = rule.generation](
                  std::size_t, httplib::DataSink& sink) {
          return lab._misbehaviour.generation() == generation && sink.write(piece.data(), piece.size());
        });
  }

  // Sends one byte at a time; after a reset, the rest at once.
  void sendDripping(Response& response, const Rule& rule, const Answer& answer) {
    response.set_content_provider(answer.body.size(), answer.type,
                                  [this, body = answer.body, apart = rule.drip, generation = rule.generation](
                                      std::size_t sent, std::size_t left, httplib::DataSink& sink) {
                                    const bool drips = sent == 0 || lab._misbehaviour.hold(generation, apart);
                                    return sink.write(&body[sent], drips ? 1 : left);
                                  });
  }

  Server& lab;
  // Declared before the server, whose context it watches.
  Connections connections;
  httplib::SSLServer http;
  std::thread accepting;
  std::atomic<bool> failed{false};
  std::atomic<unsigned> storedLogData{0};
  PostIDs postIDs;
};

Server::Server(const Directory& directory, int maxAge)
    : _directory(directory),
      _maxAge(maxAge),
      _arrivals(directory),
      _dashboard(_misbehaviour, _arrivals.dashboard) {}

Server::~Server() {
  stop();
}

std::optional<std::string> Server::start(int port, int dashboardPort) {
  for (const auto& kind : _arrivals.kinds()) {
    if (!kind.lines.ok())
      return kind.lines.path() + ": cannot be opened for appending: " + std::strerror(errno);
  }
  _library = std::make_unique<Library>(*this);
  auto& http = _library->http;
  if (!http.is_valid())
    return _directory.certificatePath() + " and its key cannot be used; remove both to have new ones made";
  _library->route();
  if (port == 0)
    port = http.bind_to_any_port("127.0.0.1");
  else if (!http.bind_to_port("127.0.0.1", port))
    port = -1;
  if (port < 0) return "the port is taken or may not be bound; --port 0 takes any free one";
  _url = "https://localhost:" + std::to_string(port);
  // Before requests are accepted, because they need its port.
  if (auto failure = _dashboard.start(dashboardPort)) return failure;
  _library->accepting = std::thread([this] { _library->failed = !_library->http.listen_after_bind(); });
  while (!http.is_running() && !_library->failed) std::this_thread::sleep_for(std::chrono::milliseconds(1));
  if (_library->failed) return "the server could not accept connections";
  return std::nullopt;
}

void Server::stop() {
  if (!_library || !_library->accepting.joinable()) return;
  _misbehaviour.stop();
  _dashboard.stop();
  for (const auto& kind : _arrivals.kinds()) kind.lines.stop();
  _library->connections.stop();
  _library->http.stop();
  _library->accepting.join();
}

}  // namespace veltrad::lab
