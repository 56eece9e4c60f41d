// SPDX-License-Identifier: Apache-2.0
// The lab's dashboard server: receives datagrams and acknowledges them as the rules say, on its own thread.
#pragma once

#include <netinet/in.h>

#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

#include "base/file_descriptor.h"
#include "misbehaviour.h"
#include "received.h"

namespace veltrad::lab {

// The path that rules for datagrams match.
inline constexpr const char* kDashboardPath = "/dashboard";

// The arguments must outlive it.
class Dashboard {
 public:
  Dashboard(Misbehaviour& misbehaviour, Received& lines) : _misbehaviour(misbehaviour), _lines(lines) {}
  ~Dashboard() { stop(); }

  // Binds to a UDP port of 127.0.0.1 (0: any) and serves. Returns one line that says what failed, if anything
  // did.
  std::optional<std::string> start(int port);
  // Constant after start().
  int port() const { return _port; }
  // Drops acknowledgements that wait.
  void stop();

 private:
  using Time = std::chrono::steady_clock::time_point;
  struct Acknowledgement {
    sockaddr_in to;
    std::string bytes;
    int socket;
  };

  void run();
  int millisecondsToNext() const;
  void sendWhatIsDue();
  void receive();
  void handle(const sockaddr_in& from, std::string_view datagram);
  void acknowledge(const sockaddr_in& from, std::string_view datagram, const Rule& rule);
  void send(const Acknowledgement& acknowledgement);
  void sendHeld();

  // Constant after start().
  Misbehaviour& _misbehaviour;
  Received& _lines;
  FileDescriptor _socket;
  // On another port.
  FileDescriptor _stranger;
  FileDescriptor _stopping;
  int _port = 0;
  std::thread _thread;

  // Own thread only.
  std::multimap<Time, Acknowledgement> _delayed;
  // Sent after the next one.
  std::optional<Acknowledgement> _held;
  Time _heldUntil;
};

}  // namespace veltrad::lab
