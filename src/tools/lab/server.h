// SPDX-License-Identifier: Apache-2.0
// The lab's HTTPS server: storebags, the event collector, log data, uploads, control and the live page.
#pragma once

#include <memory>
#include <string>

#include "arrivals.h"
#include "dashboard.h"
#include "directory.h"
#include "misbehaviour.h"

namespace veltrad::lab {

// Owns its threads and the dashboard's. `directory` must outlive it.
class Server {
 public:
  Server(const Directory& directory, int maxAge);
  ~Server();

  void add(Rule rule) { _misbehaviour.add(std::move(rule)); }
  // Binds to the TCP port and the dashboard's UDP port of 127.0.0.1 (0: any) and serves. Returns one line
  // that says what failed, if anything did.
  std::optional<std::string> start(int port, int dashboardPort);
  const std::string& url() const { return _url; }
  std::string logDataURL() const { return _url + kLogDataPath; }
  std::string uploadURL() const { return _url + kUploadPath; }
  int dashboardPort() const { return _dashboard.port(); }
  // Ends all connections and threads without waiting for clients.
  void stop();

 private:
  // The part that uses the HTTP library, which only the body includes.
  struct Library;
  static constexpr const char* kLogDataPath = "/logdata";
  static constexpr const char* kUploadPath = "/upload";

  const Directory& _directory;
  const int _maxAge;
  // Constant after start().
  std::string _url;
  Misbehaviour _misbehaviour;
  Arrivals _arrivals;
  Dashboard _dashboard;
  std::unique_ptr<Library> _library;
};

}  // namespace veltrad::lab
