// SPDX-License-Identifier: Apache-2.0
// Messages that were recorded as they were sent.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "storebag/given.h"

namespace veltrad::storebag {

struct RecordedMessage {
  // In the file, from 1.
  std::size_t line = 0;
  GivenMessage message;
  // The session's data in the line; empty in lines of `veltractl session`.
  Dictionary session;
};

// The messages in lines of `veltractl watch --json --contents` or of `veltractl session`; others are passed
// over. The error names file and line.
Result<std::vector<RecordedMessage>, std::string> readRecording(const std::string& file);
// The same without what the lines say of the session.
Result<std::vector<GivenMessage>, std::string> readMessages(const std::string& file);
// Adds what a line says of its session: client type, user info, section. Its client's entry decides.
void takeSession(const Dictionary& session, Given& given);

}  // namespace veltrad::storebag
