// The upload of a log data array. Blocks the caller's thread until the server has answered.
#pragma once

#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad {

namespace platform {
class HTTPClient;
}

// Where the server says that it stored the array, whatever its status; none, after one error line, when it
// could not be asked or said nothing.
std::optional<std::string> uploadedLogDataLocation(platform::HTTPClient& http,
                                                   const std::optional<std::string>& postURL,
                                                   const Array& logData);

}  // namespace veltrad
