// SPDX-License-Identifier: Apache-2.0
// A simulated session: answers the calls of one connection as the script says. The connection's own thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/value.h"
#include "ipc/observer.h"
#include "testing/late_answers.h"
#include "testing/script.h"

namespace veltrad::testing {

// `script` and `answers` must outlive it. It is an observer, and no session, because only an observer may
// answer any call with an error.
class SimulatedSession final : public ipc::Observer {
 public:
  SimulatedSession(Script& script, LateAnswers& answers) : _script(script), _answers(answers) {}

  std::optional<std::string> ask(const std::string& operation, Dictionary arguments,
                                 std::shared_ptr<ipc::PendingReply> reply) override;

 private:
  void describe(const Dictionary& arguments);
  std::optional<std::string> send(const Dictionary& message);

  Script& _script;
  LateAnswers& _answers;
  // "sessionInfo" and "userInfo", as they were last given.
  Dictionary _sender;
};

}  // namespace veltrad::testing
