// SPDX-License-Identifier: Apache-2.0
// Result<T, E>: a value, or an error that says why there is none.
#pragma once

#include <cstdlib>
#include <utility>
#include <variant>

namespace veltrad {

// Makes a Result that holds an error: `return Failure{Error::tooDeep};`
template <typename E>
struct Failure {
  E error;
};
template <typename E>
Failure(E) -> Failure<E>;

// The value of a Result whose operation returns nothing.
struct Done {};

// Access to the side that it does not hold aborts.
template <typename T, typename E>
class [[nodiscard]] Result {
 public:
  Result(T value) : _side(std::in_place_index<0>, std::move(value)) {}
  Result(Failure<E> failure) : _side(std::in_place_index<1>, std::move(failure.error)) {}

  bool ok() const { return _side.index() == 0; }
  explicit operator bool() const { return ok(); }

  T& value() & {
    if (!ok()) std::abort();
    return *std::get_if<0>(&_side);
  }
  const T& value() const& {
    if (!ok()) std::abort();
    return *std::get_if<0>(&_side);
  }
  T&& value() && {
    if (!ok()) std::abort();
    return std::move(*std::get_if<0>(&_side));
  }
  E& error() & {
    if (ok()) std::abort();
    return *std::get_if<1>(&_side);
  }
  const E& error() const& {
    if (ok()) std::abort();
    return *std::get_if<1>(&_side);
  }

 private:
  std::variant<T, E> _side;
};

}  // namespace veltrad
