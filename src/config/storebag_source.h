// Where the agent gets storebag sections from, and what comes of asking for one. The caller's thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad::config {

struct StorebagAnswer {
  // fetched: `content` is a storebag, or the section of one. notModified: the copy that the caller holds is
  // current. failed: neither; the log has said why.
  enum class Kind { fetched, notModified, failed };
  Kind kind = Kind::failed;
  // False: for a shortage it could not begin, or its answer not be judged, or the daemon is stopping. Nothing
  // of it is to be remembered; what was fetched all the same is for this session.
  bool attempted = true;
  std::int32_t maxAge = 0;  // seconds; 0 where no answer came
  // What makes the next request conditional: the answer's own text, even of one that then did not verify, or
  // what this request was made with.
  std::optional<std::string> lastModified;
  Dictionary content;
  std::optional<std::string> version;  // of a section's storebag, where it states one
};

class StorebagSource {
 public:
  virtual ~StorebagSource() = default;

  // The section of the client type's storebag for the process's environment. `lastModified`: of the copy that
  // the caller holds. May block for an exchange with the server; takes no lock of its own.
  virtual StorebagAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, const std::optional<std::string>& lastModified) = 0;
};

}  // namespace veltrad::config
