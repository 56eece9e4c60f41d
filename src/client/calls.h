// SPDX-License-Identifier: Apache-2.0
// Makes the frames of a session's calls, without their call IDs.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "client/sent_record.h"
#include "client/value_node.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// The ID of the upload whose file the event asks to remove; absent for other events.
std::optional<std::uint32_t> callToRemoveFileOf(const Dictionary& event);

struct CallFrame {
  // VELTRA_OK, VELTRA_INVALID or VELTRA_TOO_LARGE; there is no call unless it is VELTRA_OK.
  veltra_status status;
  OutCall call = {};
  // Describes the wrong argument, if the status alone is not enough.
  std::string problem = {};
};

CallFrame callFrame(const char* operation, std::vector<Dictionary::Entry> arguments = {});
CallFrame startFrame();
CallFrame finishFrame();
// `payload` is a dictionary or null, `flag` is 0 to 3. A message with a flag is sent as a message dictionary.
CallFrame messageFrame(std::uint16_t category, std::uint16_t type, const veltra_value* payload,
                       std::uint32_t flag);
CallFrame messageDictionaryFrame(const veltra_value* message);
// `userInfo` is a dictionary or null.
CallFrame statesFrame(const veltra_value* userInfo);
CallFrame sessionInfoFrame(const veltra_session_options& options);
CallFrame oneShotFrame(const veltra_session_options& who, std::uint16_t category, std::uint16_t type,
                       const veltra_value* payload);

// If the file cannot be opened, the frame announces no descriptor.
CallFrame uploadFileFrame(const char* path);
// `data` is an array. This is the only large call.
CallFrame logDataFrame(const veltra_value* data);

}  // namespace veltrad::client
