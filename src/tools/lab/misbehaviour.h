// How the lab has been told to misbehave: rules, each for the requests below a path. Any thread.
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

namespace veltrad::lab {

// One rule. What is not said is left as it would have been.
struct Rule {
  enum class Signature { right, wrong, missing, none };
  enum class Acknowledgement {
    right,
    dropped,
    duplicate,
    reordered,  // goes out behind the next one, or after a second
    tooShort,   // 61 bytes
    tooLong,    // 2000 bytes
    foreign,    // for another event number
    stranger,   // from another port
  };
  std::string path;                   // matches requests whose path starts with it; empty: all
  std::optional<std::int64_t> times;  // how many requests it is for; absent: until the reset
  std::optional<std::int64_t> share;  // of its requests it is for so many in a hundred, drawn at random
  std::optional<int> status;
  std::chrono::milliseconds delay{0};
  std::optional<std::chrono::milliseconds> drip;  // the body goes out a byte at a time, this far apart
  bool cut = false;                               // ends the connection without an answer
  bool cutHalfway = false;                        // ends it in the middle of the body
  bool stall = false;                             // no answer until the reset
  bool endless = false;                           // a body without end
  // wrong: one bit of it is turned; missing: the container has no "signature"; none: the bare storebag, no
  // container
  Signature sign = Signature::right;
  Acknowledgement acknowledgement = Acknowledgement::right;  // of a datagram
  bool lastModified = true;                                  // false: no "Last-Modified" header
  std::optional<std::string> body;                           // bytes
  Dictionary headers;                                        // texts; they replace headers of the same name
  std::uint64_t generation = 0;  // set by take(): the rules' generation at that time
};

// The rule that the JSON object says; else one line that names the key and what was expected.
Result<Rule, std::string> ruleFromJSON(std::string_view text);

class Misbehaviour {
 public:
  // A rule for the same path replaces the earlier one.
  void add(Rule rule);
  // The rule with the longest path that matches, counted down by one; nothing where its share leaves this
  // request out.
  std::optional<Rule> take(std::string_view path);
  // Forgets every rule and lets go whoever waits in hold().
  void reset();
  // As reset(), and nobody waits any more.
  void stop();
  // Waits until the time has passed, or without end where there is none. False: the rules have been reset
  // since that generation, or the lab stops.
  bool hold(std::uint64_t generation, std::optional<std::chrono::milliseconds> time);
  bool stopped() const;
  // Changes with every reset; a body without end lasts as long as it does not change.
  std::uint64_t generation() const;

 private:
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::vector<Rule> _rules GUARDED_BY(_mutex);
  std::minstd_rand _draw GUARDED_BY(_mutex);  // never seeded: every run draws alike
  std::uint64_t _generation GUARDED_BY(_mutex) = 0;
  bool _stopped GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::lab
