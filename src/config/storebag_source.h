// SPDX-License-Identifier: Apache-2.0
// The interface that provides storebag sections to the agent.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "wire/reasons.h"

namespace veltrad::config {

struct StorebagSection;

// Why a session does not get the server's storebag; also set with the default storebag.
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
  refused,     // signed, but not to be used: see `refusal`
  noSection,   // nothing for this environment
};

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
  StorebagCause cause = StorebagCause::none;
  std::string why;                           // one line about the cause; empty for `none`
  int status = 0;                            // of the HTTP answer; 0: none came
  std::optional<bool> genuine;               // whether the signature holds; absent: nothing was verified
  std::optional<wire::Reason> refusal = {};  // of cause `refused`
};

struct StorebagSectionAnswer : StorebagAnswer {
  // Null unless it was fetched.
  std::shared_ptr<const StorebagSection> section;
  // The version of its storebag, if it has one.
  std::optional<std::string> version;
};

// The section of a storebag that an earlier daemon has kept.
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
  // The kept section of the client type's storebag, verified again; without a section if there is nothing
  // usable.
  virtual KeptSection keptStorebag(std::int32_t) { return {}; }
  // Why a section that was fetched before may no longer be used: "expired on …"; absent if it may. Takes leaf
  // locks only.
  virtual std::optional<std::string> whyNotUsed(const StorebagSection&) { return std::nullopt; }
  // The share, from 0 to 1, by which the waits between fetches are spread. Takes leaf locks only.
  virtual double jitter() { return 0; }
};

}  // namespace veltrad::config
