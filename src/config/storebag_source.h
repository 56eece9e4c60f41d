// Where the agent gets storebag sections from, and what comes of asking for one. The caller's thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace veltrad::config {

struct StorebagSection;

// What came of asking for a storebag.
struct StorebagAnswer {
  // fetched: here it is. notModified: the copy that the caller holds is current. failed: neither; the log has
  // said why.
  enum class Kind { fetched, notModified, failed };
  Kind kind = Kind::failed;
  // False: for a shortage it could not begin, or its answer not be judged, or the daemon is stopping. Nothing
  // of it is to be remembered; what was fetched all the same is for this session.
  bool attempted = true;
  std::int32_t maxAge = 0;  // seconds; 0 where no answer came
  // What makes the next request conditional: the answer's own text, even of one that then did not verify, or
  // what this request was made with.
  std::optional<std::string> lastModified;
};

struct StorebagSectionAnswer : StorebagAnswer {
  std::shared_ptr<const StorebagSection> section;  // where it was fetched, else null
  std::optional<std::string> version;              // of its storebag, which need not state one
};

// What an earlier daemon has kept of a storebag.
struct KeptSection {
  bool known = false;  // false: not asked to keep any, or nobody can say just now
  StorebagSectionAnswer answer;
  double fetchTime = 0;  // of the answer, seconds since 1970
};

class StorebagSource {
 public:
  virtual ~StorebagSource() = default;

  // The section of the client type's storebag for the process's environment. `lastModified`: of the copy that
  // the caller holds. May block for an exchange with the server; takes no lock of its own.
  virtual StorebagSectionAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, const std::optional<std::string>& lastModified) = 0;
  // What is kept of the client type's storebag, verified again; it has a section, or nothing is there to use.
  virtual KeptSection keptStorebag(std::int32_t) { return {}; }
};

}  // namespace veltrad::config
