// SPDX-License-Identifier: Apache-2.0
// Reads lines of bounded length from a descriptor.
#pragma once

#include <cstdint>
#include <string>

#include "tools/ctl/interrupt.h"

namespace veltrad::ctl {

// The descriptor and the interrupt must outlive it. The last line may lack its line break. Lines longer than
// `longest` bytes are skipped and reported.
class LineReader {
 public:
  LineReader(int descriptor, std::size_t longest, Interrupt& interrupt)
      : _descriptor(descriptor), _longest(longest), _interrupt(interrupt) {}

  enum class Got { line, tooLong, end, interrupted, failed };
  // Reads a line, which is then in line() without its line break. After `failed`, errno says why.
  Got next();
  const std::string& line() const { return _line; }
  // The number of the last line, starting at 1.
  std::uint64_t number() const { return _number; }

 private:
  // Moves a part of the line from the buffer. True if that completes the line.
  bool takeFromBuffer();
  Got finishLine();

  const int _descriptor;
  const std::size_t _longest;
  Interrupt& _interrupt;
  std::string _buffer;
  // The start of the unread part of the buffer.
  std::size_t _at = 0;
  std::string _line;
  bool _tooLong = false;
  // A part of the line has been read.
  bool _begun = false;
  std::uint64_t _number = 0;
};

}  // namespace veltrad::ctl
