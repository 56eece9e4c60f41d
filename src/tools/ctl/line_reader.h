// Lines from a descriptor, of bounded length. Own thread only.
#pragma once

#include <cstdint>
#include <string>

#include "tools/ctl/interrupt.h"

namespace veltrad::ctl {

// The descriptor and the interrupt must outlive it. A line arrives as soon as its line break has; the last
// one may lack it. Of a line longer than `longest` bytes nothing is kept.
class LineReader {
 public:
  LineReader(int descriptor, std::size_t longest, Interrupt& interrupt)
      : _descriptor(descriptor), _longest(longest), _interrupt(interrupt) {}

  enum class Got { line, tooLong, end, interrupted, failed };
  // Without its line break, in line(). After `failed` errno says why.
  Got next();
  const std::string& line() const { return _line; }
  // Of the last line that next() gave, from 1.
  std::uint64_t number() const { return _number; }

 private:
  // Takes what the buffer holds of the line; true when its line break was among it.
  bool takeFromBuffer();
  Got finishLine();

  // Constant after construction.
  const int _descriptor;
  const std::size_t _longest;
  Interrupt& _interrupt;
  // Own thread only.
  std::string _buffer;
  std::size_t _at = 0;  // start of what is not taken yet
  std::string _line;
  bool _tooLong = false;
  bool _begun = false;  // some bytes of the line have come
  std::uint64_t _number = 0;
};

}  // namespace veltrad::ctl
