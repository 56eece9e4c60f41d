// SPDX-License-Identifier: Apache-2.0
// Reads the record of fates: turns its entries into messages and the steps of each. One thread.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "wire/fate_entries.h"

namespace veltrad::support {

// The known facts of a message's session.
struct ToldSession {
  wire::SessionEntry entry;
  std::optional<std::string> session;
  std::optional<std::string> client;
  std::optional<std::string> service;
  std::optional<std::string> storebag;
  std::optional<std::string> version;
  std::optional<std::string> section;
  std::vector<std::pair<std::string, wire::Reason>> notMade;
};

struct ToldMessage {
  std::uint64_t position = 0;
  wire::MessageEntry entry;
  // Null: overwritten.
  std::shared_ptr<const ToldSession> session;
  // The session whose client got a copy.
  std::optional<std::string> aggregatedTo;
};

// A step of one message in one back end, or in all of them (0).
struct ToldStep {
  std::uint64_t message = 0;
  wire::StepEntry entry;
  std::optional<std::string> text;
  std::optional<wire::StandingEntry> standing;
  std::vector<std::string> names;  // of fields
};

// Entries are given in the order of their positions; some may be missing.
class FateReader {
 public:
  class Listener {
   public:
    virtual ~Listener() = default;
    virtual void taken(const ToldMessage& message) = 0;
    // Also called for messages whose own entry was overwritten.
    virtual void stepped(const ToldStep& step) = 0;
  };

  // `keep`: the number of positions by which a referred entry may be older. The listener must outlive the
  // reader.
  FateReader(Listener& listener, std::uint64_t keep) : _listener(listener), _keep(keep) {}

  void read(std::uint64_t position, const wire::FateWords& words);

 private:
  // A text whose further pieces are to come.
  struct OpenText {
    std::uint64_t position = 0;
    std::uint64_t next = 0;  // where the next piece stands; 0: there is no such text
    std::size_t length = 0;
    std::string text;
  };

  std::optional<std::string> textAt(wire::FateRef reference) const;
  template <typename Kept>
  const Kept* find(const std::map<std::uint64_t, Kept>& kept, wire::FateRef reference) const;
  void readText(const wire::TextEntry& entry);
  void readMoreText(const wire::MoreTextEntry& entry);
  void takeText();
  void readSession(const wire::SessionEntry& entry);
  void readStep(const wire::StepEntry& entry);
  void readNames(const wire::NamesEntry& entry);
  std::vector<std::uint64_t> messagesOf(const wire::StepEntry& entry);
  void forgetOld();

  Listener& _listener;
  const std::uint64_t _keep;

  std::uint64_t _position = 0;
  // By position.
  std::map<std::uint64_t, std::string> _texts;
  std::map<std::uint64_t, std::shared_ptr<const ToldSession>> _sessions;
  std::map<std::uint64_t, wire::StandingEntry> _standings;
  OpenText _open;
  // The messages in each batch and each post.
  std::map<std::uint64_t, std::vector<std::uint64_t>> _batches;
  std::map<std::uint64_t, std::vector<std::uint64_t>> _posts;
};

}  // namespace veltrad::support
