// The lab's dashboard server: takes datagrams in and acknowledges them, well or badly. One thread of its own.
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

// Owns its thread. Both arguments must outlive it.
class Dashboard {
 public:
  Dashboard(Misbehaviour& misbehaviour, Received& lines) : _misbehaviour(misbehaviour), _lines(lines) {}
  ~Dashboard() { stop(); }
  Dashboard(const Dashboard&) = delete;
  Dashboard& operator=(const Dashboard&) = delete;

  // Binds to the UDP port of 127.0.0.1 (0: any) and serves. Nothing: it serves; else one line that says why
  // not.
  std::optional<std::string> start(int port);
  // Constant after start().
  int port() const { return _port; }
  // Acknowledgements that wait are given up.
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
  FileDescriptor _stranger;  // a socket on another port
  FileDescriptor _stopping;  // an event descriptor
  int _port = 0;
  std::thread _thread;

  // Own thread only.
  std::multimap<Time, Acknowledgement> _delayed;
  std::optional<Acknowledgement> _held;  // goes out behind the next one
  Time _heldUntil;
};

}  // namespace veltrad::lab
