// The answer to a call, as the C interface's veltra_reply holds it. A value with one owner; any thread.
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
#include "wire/error.h"

struct veltra_reply {
  veltra_status status = VELTRA_OK;
  std::optional<std::string> text;
  veltrad::client::ValuePointer backends;
  bool uploaded = false;
  bool removed = false;
  std::optional<veltrad::wire::ReportingError> error;
  std::shared_ptr<veltrad::client::UploadedFile> file;  // of an upload that is not settled
};

namespace veltrad::client {

using Answer = std::unique_ptr<veltra_reply>;

// The body of a reply frame. One that cannot be read ends its call with VELTRA_NO_REPLY and says so.
Answer answerOfReply(std::string_view body);
// A call that ended without the daemon's word; the description is the status's own text unless one is given.
Answer answerOfStatus(veltra_status status, const char* description = nullptr);
// What an upload's answer means for its file: removes it where the daemon has asked for that, and says why it
// stays or was not taken. For any other answer nothing.
void settleUpload(veltra_reply& answer);

}  // namespace veltrad::client
