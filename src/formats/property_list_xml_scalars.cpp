// SPDX-License-Identifier: Apache-2.0
// Numbers and dates of XML property lists, with std::from_chars and the calendar of std::chrono.
#include "formats/property_list_xml_scalars.h"

#include <fmt/format.h>

#include <charconv>
#include <chrono>
#include <cmath>
#include <limits>

#include "base/text.h"

namespace veltrad::formats::xml_property_list {

namespace {

constexpr double kFirstSecond = -62'167'219'200;  // 0000-01-01T00:00:00Z
constexpr double kLastSecond = 253'402'300'799;   // 9999-12-31T23:59:59Z

// True if there was a sign, which is then removed.
bool takeSign(std::string_view& text, bool& negative) {
  negative = text.starts_with('-');
  if (!negative && !text.starts_with('+')) return false;
  text.remove_prefix(1);
  return true;
}

// Exactly `width` digits.
bool takeField(std::string_view text, std::size_t at, std::size_t width, unsigned& field) {
  field = 0;
  for (const char c : text.substr(at, width)) {
    if (c < '0' || c > '9') return false;
    field = field * 10 + static_cast<unsigned>(c - '0');
  }
  return true;
}

}  // namespace

std::optional<Value> parseInteger(std::string_view text) {
  text = trimmed(text);
  bool negative = false;
  takeSign(text, negative);
  int base = 10;
  if (text.starts_with("0x") || text.starts_with("0X")) {
    text.remove_prefix(2);
    base = 16;
  }
  std::uint64_t magnitude = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), magnitude, base);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  constexpr std::uint64_t kMostSigned = std::numeric_limits<std::int64_t>::max();
  if (negative) {
    if (magnitude > kMostSigned + 1) return std::nullopt;
    return Value(static_cast<std::int64_t>(0 - magnitude));
  }
  if (magnitude > kMostSigned) return Value(magnitude);
  return Value(static_cast<std::int64_t>(magnitude));
}

std::optional<Value> parseReal(std::string_view text) {
  text = trimmed(text);
  bool negative = false;
  if (takeSign(text, negative) && (text.starts_with('-') || text.starts_with('+'))) return std::nullopt;
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return negative ? -number : number;
}

std::optional<Value> parseDate(std::string_view text) {
  text = trimmed(text);
  constexpr std::string_view kShape = "0000-00-00T00:00:00Z";
  if (text.size() != kShape.size()) return std::nullopt;
  for (std::size_t i = 0; i < kShape.size(); ++i) {
    if (kShape[i] != '0' && text[i] != kShape[i]) return std::nullopt;
  }
  unsigned year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0;
  if (!takeField(text, 0, 4, year) || !takeField(text, 5, 2, month) || !takeField(text, 8, 2, day) ||
      !takeField(text, 11, 2, hour) || !takeField(text, 14, 2, minute) || !takeField(text, 17, 2, second)) {
    return std::nullopt;
  }
  const std::chrono::year_month_day date(std::chrono::year(static_cast<int>(year)), std::chrono::month(month),
                                         std::chrono::day(day));
  if (!date.ok() || hour > 23 || minute > 59 || second > 59) return std::nullopt;
  const auto days = std::chrono::sys_days(date).time_since_epoch().count();
  return Date{static_cast<double>(days) * 86'400 + hour * 3'600 + minute * 60 + second};
}

std::string dateText(Date date) {
  double seconds = date.secondsSince1970;
  if (!(seconds >= kFirstSecond)) seconds = kFirstSecond;
  if (seconds > kLastSecond) seconds = kLastSecond;
  const auto whole = static_cast<std::int64_t>(std::floor(seconds));
  const std::chrono::sys_seconds at{std::chrono::seconds(whole)};
  const auto midnight = std::chrono::floor<std::chrono::days>(at);
  const std::chrono::year_month_day day(midnight);
  const auto inDay = (at - midnight).count();
  return fmt::format("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}Z", static_cast<int>(day.year()),
                     static_cast<unsigned>(day.month()), static_cast<unsigned>(day.day()), inDay / 3'600,
                     inDay / 60 % 60, inDay % 60);
}

}  // namespace veltrad::formats::xml_property_list
