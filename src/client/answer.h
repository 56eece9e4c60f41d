// SPDX-License-Identifier: Apache-2.0
// The answer to a call, which is the C interface's veltra_reply.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
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
  std::optional<veltrad::Value> outcomes;
  // Built on the first request, because few callers need them.
  mutable std::once_flag outcomesAsked;
  mutable veltrad::client::ValuePointer outcomesNode;
  bool uploaded = false;
  bool removed = false;
  std::optional<veltrad::wire::ReportingError> error;
  // The file of an upload that is not settled yet.
  std::shared_ptr<veltrad::client::UploadedFile> file;
};

namespace veltrad::client {

using Answer = std::unique_ptr<veltra_reply>;

// From the body of a reply frame. The status is VELTRA_NO_REPLY if it cannot be read.
Answer answerOfReply(std::string_view body);
// For a call that ended without a reply. The description is the status's text unless one is given.
Answer answerOfStatus(veltra_status status, const char* description = nullptr);
// Removes the file of an upload if the daemon has asked for that. The answer's error says why the file was
// not removed or not taken. Does nothing for other answers.
void settleUpload(veltra_reply& answer);

}  // namespace veltrad::client
