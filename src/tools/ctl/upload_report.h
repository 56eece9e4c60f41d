// What `veltractl upload` says on standard error while a file is uploaded and afterwards. The main thread.
#pragma once

#include <string>

#include "tools/ctl/answers.h"
#include "tools/ctl/client_session.h"

namespace veltrad::ctl {

// On a terminal one line that counts the seconds; elsewhere nothing.
ClientSession::Progress uploadProgress(const std::string& path);
// What became of the file, by an answer whose status is VELTRA_OK. True: it was uploaded.
bool reportUpload(const std::string& path, const Answer& answer);

}  // namespace veltrad::ctl
