// SPDX-License-Identifier: Apache-2.0
// Receives dashboards' datagrams on a thread of its own. A datagram is acknowledged when the stream has
// taken it.
#pragma once

#include <netinet/in.h>

#include <atomic>
#include <memory>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "base/thread.h"
#include "gateway/publisher.h"

namespace veltrad::gateway {

// The datagram as the stream's message has it: a JSON object, and an ID that is the same whenever it is sent.
Message messageOfDatagram(std::string_view datagram);

class DatagramReceiver {
 public:
  // The publisher and the metrics must outlive it. `most`: what waits for the stream, so that a flood leaves
  // room for posts.
  DatagramReceiver(Publisher& publisher, Metrics& metrics, std::size_t most)
      : _publisher(publisher), _metrics(metrics), _most(most) {}
  ~DatagramReceiver() { stop(); }

  // Binds to "ADDRESS:PORT" (IPv4), which other gateways may share, and serves. Returns the address with the
  // port that was given for port 0.
  Result<std::string, std::string> start(const std::string& address);
  // Takes nothing any more. What the stream takes later is still acknowledged.
  void stop();

 private:
  // Outlives the receiver where completions still hold it.
  struct Socket {
    FileDescriptor descriptor;
    std::atomic<std::size_t> underWay{0};
  };
  // Whom to answer, and from which of the machine's addresses.
  struct Sender {
    sockaddr_in from{};
    in_addr at{};
  };

  void run();
  bool receive(char* room, std::size_t size);
  void handle(const Sender& sender, std::string_view datagram);
  static void acknowledge(const Socket& socket, const Sender& sender, const std::string& header);

  Publisher& _publisher;
  Metrics& _metrics;
  const std::size_t _most;
  std::shared_ptr<Socket> _socket = std::make_shared<Socket>();
  FileDescriptor _stopping;
  // By the kernel, so far; its number wraps.
  std::uint32_t _dropped = 0;
  Thread _thread;
};

}  // namespace veltrad::gateway
