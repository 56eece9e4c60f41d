// The interface from which the agent gets storebag sections, and its answers.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace veltrad::config {

struct StorebagSection;

struct StorebagAnswer {
  // notModified: the caller's copy is current. failed: the reason was logged.
  enum class Kind { fetched, notModified, failed };
  Kind kind = Kind::failed;
  // False if a shortage prevented the request or the check of the answer, or the daemon is stopping. Then the
  // answer must not be cached; a storebag in it is only for this session.
  bool attempted = true;
  // In seconds; 0 if there was no answer.
  std::int32_t maxAge = 0;
  // For the next request: the answer's text, even if the answer was not valid, or that of this request.
  std::optional<std::string> lastModified;
};

struct StorebagSectionAnswer : StorebagAnswer {
  // Null unless it was fetched.
  std::shared_ptr<const StorebagSection> section;
  // Of its storebag, which need not have one.
  std::optional<std::string> version;
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

  // The section of the client type's storebag for the process's environment. `lastModified` is the text of
  // the caller's copy. May block for a request to the server.
  virtual StorebagSectionAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, const std::optional<std::string>& lastModified) = 0;
  // What is kept of the client type's storebag, verified again; it has a section, or nothing is there to use.
  virtual KeptSection keptStorebag(std::int32_t) { return {}; }
};

}  // namespace veltrad::config
