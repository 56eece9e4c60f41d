// SPDX-License-Identifier: Apache-2.0
// Computes when an address of the spool is tried again. All times are seconds of one clock, and the caller
// supplies the random numbers. The owner guards it.
#pragma once

#include <string>

namespace veltrad::backends {

struct SpoolPace {
  double postsPerSecond = 4;
  double firstWait = 30;
  double longestWait = 900;
};

class SpoolWait {
 public:
  // The pace must outlive it.
  explicit SpoolWait(const SpoolPace& pace) : _pace(&pace), _wait(pace.firstWait) {}

  // From a failure until a success the oldest post alone is tried, and new ones are kept.
  bool failing() const { return _failing; }
  // New posts are kept, because the address fails, or has asked for time.
  bool refuses(double now) const { return _failing || now < _retryUntil; }
  // When the next post may leave.
  double next() const;
  // The same without the pace, for people; 0 means now.
  double nextTry() const;
  const std::string& lastError() const { return _lastError; }

  // A post has failed. `wasTry`: it was one of the spool, so that the wait doubles. `retryAfter`: what the
  // server asks for; 0: nothing. `draw`: in [0, 1).
  void failed(double now, bool wasTry, double retryAfter, double draw, std::string error);
  // The server has given an answer for which the post is not kept.
  void succeeded();
  // A post has been begun.
  void left(double now);
  // No post leaves before then, because this side cannot send at the moment.
  void postponed(double until);
  // No post is left. A wait that the server has asked for stays.
  void emptied();
  // A route has come, or the machine has woken.
  void woken(double now, double draw);
  // Somebody asks for a try now.
  void hurried();

 private:
  const SpoolPace* _pace;
  bool _failing = false;
  double _wait;  // the longest time to the next try
  double _nextTry = 0;
  double _retryUntil = 0;
  double _nextLeave = 0;  // by the pace
  std::string _lastError;
};

}  // namespace veltrad::backends
