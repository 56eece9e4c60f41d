// Where the agent gets storebag sections from, and what comes of asking for one. The caller's thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace veltrad::config {

struct StorebagSection;

// Why the server's word is not what a session gets, the default storebag included.
enum class StorebagCause {
  none,        // it is; or the copy is current
  noAttempt,   // short of something just now, or stopping
  noName,      // the client type has no storebag
  resolve,     // the server's name could not be resolved
  connect,     // nobody answers at its address
  trust,       // its certificate is not trusted
  noAnswer,    // cut, too late, or the address is no HTTPS address
  noStorebag,  // an answer, but no property list
  publicKey,   // this device has no key that could verify it
  signature,   // missing, or not by this device's key
  content,     // signed, but no storebag
  noSection,   // nothing for this environment
};

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
  StorebagCause cause = StorebagCause::none;
  std::string why;              // one line about the cause; empty for `none`
  int status = 0;               // of the HTTP answer; 0: none came
  std::optional<bool> genuine;  // whether the signature holds; absent: nothing was verified
};

struct StorebagSectionAnswer : StorebagAnswer {
  std::shared_ptr<const StorebagSection> section;  // where it was fetched, else null
  std::optional<std::string> version;              // of its storebag, which need not state one
};

class StorebagSource {
 public:
  virtual ~StorebagSource() = default;

  // The section of the client type's storebag for the process's environment. `lastModified`: of the copy that
  // the caller holds. May block for an exchange with the server; takes no lock of its own.
  virtual StorebagSectionAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, const std::optional<std::string>& lastModified) = 0;
};

}  // namespace veltrad::config
