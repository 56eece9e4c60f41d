// SPDX-License-Identifier: Apache-2.0
// Collects the fate of each message from the record of fates. One thread.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "support/fate_reader.h"

namespace veltrad::support {

// One message in one back end. Its 16 fields are what is known of it.
struct BackendFate {
  std::optional<wire::StandingEntry> standing;  // none: the back end was not made
  wire::Fate fate = wire::Fate::none;
  std::optional<wire::Reason> reason;  // what kept it back, or why nothing is known of it
  std::optional<std::uint16_t> eventNumber;
  // Names of fields, as the message left.
  std::set<std::string> removed;
  std::set<std::string> hashed;
  std::uint64_t batch = 0;
  std::uint64_t post = 0;
  std::optional<std::string> url;
  std::uint32_t bytes = 0;
  std::uint32_t events = 0;
  std::optional<int> status;
  // While it is kept: what went wrong, and when its address is tried again, in microseconds since 1970.
  std::string keptFor;
  std::int64_t nextTry = 0;
  int transmissions = 0;
  std::vector<ToldStep> road;
};

struct MessageFates {
  ToldMessage message;
  // The steps before it reached the back ends.
  std::vector<ToldStep> road;
  // By name.
  std::map<std::string, BackendFate> backends;
};

class FateBook final : public FateReader::Listener {
 public:
  // By number.
  const std::map<std::uint64_t, MessageFates>& messages() const { return _messages; }

  void taken(const ToldMessage& message) override;
  void stepped(const ToldStep& step) override;

 private:
  std::map<std::uint64_t, MessageFates> _messages;
};

}  // namespace veltrad::support
