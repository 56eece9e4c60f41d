// SPDX-License-Identifier: Apache-2.0
// Reads dates as RFC 3339 writes them.
#include "config/expiry_date.h"

#include <chrono>

namespace veltrad::config {
namespace {

constexpr int kSecondsOfMinute = 60, kSecondsOfHour = 3'600, kSecondsOfDay = 86'400;

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

// Takes parts off the front of a text. After the first that does not fit, nothing does.
class Scan {
 public:
  explicit Scan(std::string_view text) : _rest(text) {}

  // Exactly so many digits.
  int number(std::size_t digits) {
    int number = 0;
    for (std::size_t i = 0; i < digits; ++i) {
      _fits = _fits && i < _rest.size() && isDigit(_rest[i]);
      if (_fits) number = number * 10 + (_rest[i] - '0');
    }
    if (_fits) _rest.remove_prefix(digits);
    return number;
  }
  bool any(std::string_view characters) {
    const bool found = !_rest.empty() && characters.find(_rest.front()) != std::string_view::npos;
    if (found) _rest.remove_prefix(1);
    return found;
  }
  void must(std::string_view characters) { _fits = any(characters) && _fits; }
  // The digits behind a point, as a part of one.
  double fraction() {
    double part = 0, worth = 0.1;
    if (!any(".")) return 0;
    if (_rest.empty() || !isDigit(_rest.front())) _fits = false;
    while (!_rest.empty() && isDigit(_rest.front())) {
      part += worth * (_rest.front() - '0');
      worth /= 10;
      _rest.remove_prefix(1);
    }
    return part;
  }
  char front() const { return _rest.empty() ? '\0' : _rest.front(); }
  bool fits() const { return _fits; }
  bool atEnd() const { return _rest.empty(); }

 private:
  std::string_view _rest;
  bool _fits = true;
};

// Seconds within the day; more than a day for what is no time. A leap second is the next minute's first.
double timeOfDay(Scan& scan) {
  constexpr double kNone = 2.0 * kSecondsOfDay;
  const int hour = scan.number(2);
  scan.must(":");
  const int minute = scan.number(2);
  scan.must(":");
  const int second = scan.number(2);
  if (hour > 23 || minute > 59 || second > 60) return kNone;
  return hour * kSecondsOfHour + minute * kSecondsOfMinute + second + scan.fraction();
}

// Seconds by which the local time is ahead of UTC; more than a day for what is no offset.
int offset(Scan& scan) {
  if (scan.any("Zz")) return 0;
  const int sign = scan.front() == '-' ? -1 : 1;
  scan.must("+-");
  const int hours = scan.number(2);
  scan.must(":");
  const int minutes = scan.number(2);
  if (hours > 23 || minutes > 59) return 2 * kSecondsOfDay;
  return sign * (hours * kSecondsOfHour + minutes * kSecondsOfMinute);
}

}  // namespace

std::optional<double> expiryOf(std::string_view text) {
  Scan scan(text);
  const int year = scan.number(4);
  scan.must("-");
  const int month = scan.number(2);
  scan.must("-");
  const int day = scan.number(2);
  const std::chrono::year_month_day date{std::chrono::year(year),
                                         std::chrono::month(static_cast<unsigned>(month)),
                                         std::chrono::day(static_cast<unsigned>(day))};
  constexpr int kFirstYear = 1970;
  if (!scan.fits() || !date.ok() || year < kFirstYear) return std::nullopt;
  const double midnight =
      static_cast<double>(std::chrono::sys_days(date).time_since_epoch().count()) * kSecondsOfDay;
  if (scan.atEnd()) return midnight + kSecondsOfDay;
  scan.must("Tt ");
  const double time = timeOfDay(scan);
  const int ahead = offset(scan);
  if (!scan.fits() || !scan.atEnd() || time > kSecondsOfDay || ahead > kSecondsOfDay) return std::nullopt;
  return midnight + time - ahead;
}

}  // namespace veltrad::config
