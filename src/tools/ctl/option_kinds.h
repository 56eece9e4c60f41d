// SPDX-License-Identifier: Apache-2.0
// Options and arguments that several commands of veltractl have.
#pragma once

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <charconv>
#include <limits>
#include <optional>
#include <string>

#include "base/text.h"

namespace veltrad::ctl {

template <typename T>
struct NumberOf {
  using Type = T;
};
template <typename T>
struct NumberOf<std::optional<T>> {
  using Type = T;
};

// A decimal number in the range of T; T may be an optional number. The error names the range.
template <typename T>
CLI::Option* addNumber(CLI::App& command, const std::string& name, T& target, const std::string& help) {
  using Number = typename NumberOf<T>::Type;
  const auto read = [name, &target](const std::string& text) {
    Number number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) {
      throw CLI::ValidationError(name, fmt::format("expected an integer from {} to {}, found \"{}\"",
                                                   std::numeric_limits<Number>::min(),
                                                   std::numeric_limits<Number>::max(), escapedForLog(text)));
    }
    target = number;
  };
  return command.add_option_function<std::string>(name, read, help)->type_name("N");
}

// One that the command needs.
template <typename T>
CLI::Option* addArgument(CLI::App& command, const std::string& name, T& target, const std::string& help) {
  return command.add_option(name, target, help)->type_name("")->required();
}

}  // namespace veltrad::ctl
