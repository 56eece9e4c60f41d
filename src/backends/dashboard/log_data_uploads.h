// SPDX-License-Identifier: Apache-2.0
// Uploads arrays of log data. Each upload blocks its caller until the server has answered. Any thread.
#pragma once

#include <optional>
#include <string>

#include "backends/dashboard/udp_packet_to_send.h"
#include "base/value.h"
#include "http/http_client.h"
#include "platform/counters.h"
#include "platform/fate_writer.h"

namespace veltrad::backends {

// One object serves all dashboard back ends, which it outlives. The memory of the array and its archive is
// charged with the call that delivered it.
class LogDataUploads {
 public:
  LogDataUploads(http::HTTPClient& http, platform::Counters& counters) : _http(http), _counters(counters) {}

  // Returns the location in the server's answer, whatever its status. Nothing, after one error line, if there
  // is no answer or it is empty. Also writes the steps with the pen; `fate` names the upload.
  std::optional<std::string> upload(const std::optional<std::string>& postURL, const Array& logData,
                                    const DatagramOwner& owner, const platform::FateWriter& pen,
                                    wire::StepEntry fate);

 private:
  http::HTTPResult post(const std::string& url, std::string archive, const DatagramOwner& owner);

  http::HTTPClient& _http;
  platform::Counters& _counters;
};

}  // namespace veltrad::backends
