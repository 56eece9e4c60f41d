// The lab's HTTPS server: storebags, the event collector, log data, uploads, control and the live page. Runs
// on the HTTP library's threads and one that accepts; the library is included in the body alone.
#pragma once

#include <memory>
#include <string>

#include "answers.h"
#include "arrivals.h"
#include "dashboard.h"
#include "directory.h"
#include "misbehaviour.h"

namespace veltrad::lab {

// Owns its threads, the dashboard's too. `directory` must outlive it.
class Server {
 public:
  Server(const Directory& directory, int maxAge);
  ~Server();
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;

  void add(Rule rule) { _misbehaviour.add(std::move(rule)); }
  // Binds to the ports of the loopback, TCP and the dashboard's UDP (0: any), and serves. Nothing: it serves;
  // else one line that says why not.
  std::optional<std::string> start(int port, int dashboardPort);
  const std::string& url() const { return _url; }
  std::string logDataURL() const { return _url + kLogDataPath; }
  std::string uploadURL() const { return _url + kUploadPath; }
  int dashboardPort() const { return _dashboard.port(); }
  // Ends every connection and every thread; at once, whatever the clients do.
  void stop();

 private:
  struct Library;  // the HTTP library's side
  static constexpr const char* kLogDataPath = "/logdata";
  static constexpr const char* kUploadPath = "/upload";

  const Directory& _directory;
  const int _maxAge;
  std::string _url;  // set by start(), before any request
  Misbehaviour _misbehaviour;
  Arrivals _arrivals;
  Dashboard _dashboard;
  std::unique_ptr<Library> _library;
};

}  // namespace veltrad::lab
