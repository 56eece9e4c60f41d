// SPDX-License-Identifier: Apache-2.0
// Asks the daemon for the record of fates, and reads it. One thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "base/result.h"
#include "support/fate_reader.h"
#include "tools/ctl/control_client.h"

namespace veltrad::ctl {

class FateSource {
 public:
  // Both must outlive it.
  FateSource(ControlClient& daemon, support::FateReader::Listener& listener)
      : _daemon(daemon), _listener(listener) {}

  // Reads what has been written since the last call. If not `patient`, passes over what is being written at
  // the moment. The error is one line.
  Result<Done, std::string> readOn(bool patient);
  // The last call has stopped at something that was not written yet.
  bool waits() const { return _waits; }
  // The data of messages before this position is incomplete.
  std::uint64_t horizon() const { return _horizon; }
  // How many messages the daemon had taken in before the last call.
  std::uint64_t messages() const { return _messages; }
  // Entries that were overwritten before they could be read, those before the first call included.
  std::uint64_t missing() const { return _missing; }

 private:
  Result<Done, std::string> read(const Dictionary& answer);

  ControlClient& _daemon;
  support::FateReader::Listener& _listener;
  std::unique_ptr<support::FateReader> _reader;  // null before the first answer
  std::uint64_t _next = 1;
  std::uint64_t _expected = 1;
  std::uint64_t _horizon = 0;
  std::uint64_t _messages = 0;
  std::uint64_t _missing = 0;
  bool _waits = false;
};

}  // namespace veltrad::ctl
