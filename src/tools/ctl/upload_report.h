// SPDX-License-Identifier: Apache-2.0
// Prints the progress and result of `veltractl upload` on standard error.
#pragma once

#include <string>

#include "tools/ctl/answers.h"
#include "tools/ctl/client_session.h"

namespace veltrad::ctl {

// On a terminal prints a line that counts the seconds.
ClientSession::Progress uploadProgress(const std::string& path);
// Prints the result, for an answer with the status VELTRA_OK. Returns whether the file was uploaded.
bool reportUpload(const std::string& path, const Answer& answer);

}  // namespace veltrad::ctl
