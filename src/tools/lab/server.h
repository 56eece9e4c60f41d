// The lab's HTTPS server: storebags, the event collector, control and the live page. Runs on the HTTP
// library's threads and one that accepts; the library is included in the body alone.
#pragma once

#include <memory>
#include <string>

#include "answers.h"
#include "directory.h"
#include "misbehaviour.h"
#include "received.h"

namespace veltrad::lab {

// Owns its threads. `directory` must outlive it.
class Server {
 public:
  Server(const Directory& directory, int maxAge);
  ~Server();
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;

  void add(Rule rule) { _misbehaviour.add(std::move(rule)); }
  // Binds to the port of the loopback (0: any) and serves. Nothing: it serves; else one line that says why
  // not.
  std::optional<std::string> start(int port);
  const std::string& url() const { return _url; }
  // Ends every connection and every thread; at once, whatever the clients do.
  void stop();

 private:
  struct Library;  // the HTTP library's side

  const Directory& _directory;
  const int _maxAge;
  std::string _url;  // set by start(), before any request
  Misbehaviour _misbehaviour;
  Received _events;
  Received _storebags;
  std::unique_ptr<Library> _library;
};

}  // namespace veltrad::lab
