// Where the agent gets storebag sections from. The caller's thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace veltrad::config {

struct StorebagSection;

class StorebagSource {
 public:
  virtual ~StorebagSource() = default;

  // The section of the client type's storebag for the process's environment, or null. May block for an
  // exchange with the server; takes no lock of its own. The slots belong to the caller: `maxAge` (seconds,
  // out), `version` (out, written only with a section), `notModified` (out, set to true only), `lastModified`
  // (in and out; may be null), `attempted` (out, set to false only: nothing of this is to be remembered; a
  // section that came all the same is for this session).
  virtual std::shared_ptr<const StorebagSection> fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, std::int32_t& maxAge, std::optional<std::string>& version, bool& notModified,
      std::optional<std::string>* lastModified, bool& attempted) = 0;
};

}  // namespace veltrad::config
