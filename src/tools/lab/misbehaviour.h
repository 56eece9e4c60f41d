// SPDX-License-Identifier: Apache-2.0
// The rules by which the lab misbehaves, each for the requests below a path. Any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"
#include "base/result.h"
#include "base/value.h"
#include "stamp.h"

namespace veltrad::lab {

// Its 20 fields are the keys of a rule (see `veltra-lab --help`), when it ends, and the generation. A default
// changes nothing.
struct Rule {
  // wrong: one bit is inverted; missing: the container has no "signature"; none: the storebag without a
  // container.
  enum class Signature { right, wrong, missing, none };
  // reordered: sent after the next one, or after a second; foreign: for another event number; stranger: from
  // another port.
  enum class Acknowledgement { right, dropped, duplicate, reordered, tooShort, tooLong, foreign, stranger };
  // A prefix of the request's path.
  std::string path;
  // How many requests the rule is applied to; absent: to all until the reset.
  std::optional<std::int64_t> times;
  // The percentage of requests that the rule is applied to, drawn at random.
  std::optional<std::int64_t> share;
  std::optional<int> status;
  std::chrono::milliseconds delay{0};
  // The body is sent one byte at a time, with this interval.
  std::optional<std::chrono::milliseconds> drip;
  bool cut = false;
  bool cutHalfway = false;
  // No answer until the reset.
  bool stall = false;
  bool endless = false;
  Signature sign = Signature::right;
  // The changes to a correctly signed storebag.
  std::optional<Stamp> bag;
  Acknowledgement acknowledgement = Acknowledgement::right;
  // Whether there is a "Last-Modified" header.
  bool lastModified = true;
  std::optional<std::string> body;
  // Texts that replace headers of the same name.
  Dictionary headers;
  // Applied in turn, each until its times or its time are over; then the rule has ended.
  std::vector<Rule> script;
  // How long the rule is applied, from the first request on.
  std::optional<std::chrono::milliseconds> lasts;
  std::optional<std::chrono::steady_clock::time_point> end;
  // The generation of the rules when take() returned this one.
  std::uint64_t generation = 0;
};

// Reads a rule. The error is one line that names the key and what was expected.
Result<Rule, std::string> ruleFromJSON(std::string_view text);

// Its draws are not seeded, so that every run gets the same numbers.
// NOLINTNEXTLINE(cert-msc51-cpp)
class Misbehaviour {
 public:
  // A rule for the same path replaces the earlier one.
  void add(Rule rule);
  // Returns the matching rule with the longest path and counts it down. Nothing if its share excludes this
  // request.
  std::optional<Rule> take(std::string_view path);
  // Removes all rules and ends all calls of hold().
  void reset();
  // Like reset(); then hold() no longer waits.
  void stop();
  // Waits for the given time, or without a limit. False if the rules have been reset since that generation,
  // or the lab stops.
  bool hold(std::uint64_t generation, std::optional<std::chrono::milliseconds> time);
  bool stopped() const;
  // Changes with every reset, which ends an endless body.
  std::uint64_t generation() const;

 private:
  std::optional<Rule> applied(std::vector<Rule>::iterator rule) REQUIRES(_mutex);

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::vector<Rule> _rules GUARDED_BY(_mutex);
  std::minstd_rand _draw GUARDED_BY(_mutex);
  std::uint64_t _generation GUARDED_BY(_mutex) = 0;
  bool _stopped GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::lab
