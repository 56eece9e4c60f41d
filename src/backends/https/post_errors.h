// The line about posts that failed, which a client or a server can cause at will. Any thread.
#pragma once

#include <optional>
#include <string>

#include "platform/limited_line.h"
#include "platform/log.h"

namespace veltrad::backends {

// One for all back ends, so that many sessions make no more lines than one.
class PostErrors {
 public:
  void happened(const std::string& description) { log(_line.happened(description)); }
  // What no line has said yet: at the end.
  void sayRest() { log(_line.rest()); }

 private:
  static void log(const std::optional<std::string>& text) {
    if (text) logError("HTTPSPostBackend(postJsonMessage): post error: %s", text->c_str());
  }

  platform::LimitedLine _line{"posts"};
};

}  // namespace veltrad::backends
