// The calls of a session as frames, ready for the wire but for their call id. Pure functions; any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "client/uploaded_file.h"
#include "client/value_node.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// The upload whose file the daemon's event asks to remove; nothing for other events.
std::optional<std::uint32_t> callToRemoveFileOf(const Dictionary& event);

struct CallFrame {
  veltra_status status;                          // VELTRA_OK, VELTRA_INVALID or VELTRA_TOO_LARGE
  std::string frame;                             // empty unless VELTRA_OK
  std::shared_ptr<UploadedFile> file = nullptr;  // of an upload
};

CallFrame callFrame(const char* operation, std::vector<Dictionary::Entry> arguments = {});
// `payload` is a dictionary or null. Without a flag the call has no room for one; with one it goes as a
// dictionary.
CallFrame messageFrame(std::uint16_t category, std::uint16_t type, const veltra_value* payload,
                       std::uint32_t flag);
CallFrame messageDictionaryFrame(const veltra_value* message);
// `userInfo` is a dictionary or null.
CallFrame statesFrame(const veltra_value* userInfo);
CallFrame sessionInfoFrame(const veltra_session_options& options);
CallFrame oneShotFrame(const veltra_session_options& who, std::uint16_t category, std::uint16_t type,
                       const veltra_value* payload);

// `path` is not null. Without the file's descriptor where it cannot be opened: the daemon then says why.
CallFrame uploadFileFrame(const char* path);
// `data` is an array; the one call whose frame may be a large one.
CallFrame logDataFrame(const veltra_value* data);

}  // namespace veltrad::client
