// SPDX-License-Identifier: Apache-2.0
// Runs a start message, the given messages and a flush through one back end of a session.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "config/field_rules.h"
#include "session/backend_set.h"
#include "storebag/dry_world.h"
#include "storebag/explanation.h"

namespace veltrad::storebag {

class DryRun {
 public:
  // `given` must outlive it.
  DryRun(const Given& given, const std::string& name, const backends::SharedProfile& profile);

  // Null: the back end is not made, for reasonAgainst().
  const backends::VeltraBackend* backend() const { return _backend.get(); }
  wire::Reason reasonAgainst() const { return _notMade.at(0).second; }
  void play();

  // By number of the message; 0 is the start message.
  const std::map<std::size_t, Dictionary>& events() const { return _events; }
  const MessageFate& fateOf(std::size_t message) const { return _fates[message]; }
  // The payload of a message after the owner's policy was applied, and the changes.
  const Dictionary& payloadOf(std::size_t message) const { return _payloads[message]; }
  const config::EditedFields& editsOf(std::size_t message) const { return _edits[message]; }
  const std::optional<Dictionary>& sentUserInfo() const { return _sentUserInfo; }
  const config::EditedFields& userInfoEdits() const { return _userInfoEdits; }

 private:
  void applyPolicy(Dictionary& content, config::EditedFields& edits) const;
  void send(const GivenMessage& message);
  void takePosts(std::size_t droppedBefore, std::optional<std::size_t> own);
  void settle(const KeptPosts::Post& post, const std::vector<std::size_t>& messages);
  std::size_t droppedSoFar() const;

  const Given& _given;
  DryWorld _world;
  const std::shared_ptr<const config::OwnerDecision> _decision;
  std::optional<Dictionary> _sentUserInfo;
  config::EditedFields _userInfoEdits;
  session::NotMade _notMade;
  std::shared_ptr<backends::VeltraBackend> _backend;

  std::vector<MessageFate> _fates;
  std::vector<Dictionary> _payloads;
  std::vector<config::EditedFields> _edits;
  // The numbers of the messages in the batch, in order.
  std::vector<std::size_t> _batch;
  std::map<std::size_t, Dictionary> _events;
};

}  // namespace veltrad::storebag
