// SPDX-License-Identifier: Apache-2.0
// Reads lines from a descriptor.
#include "tools/ctl/line_reader.h"

#include <unistd.h>

#include <cerrno>

namespace veltrad::ctl {

LineReader::Got LineReader::next() {
  _line.clear();
  _tooLong = false;
  _begun = false;
  while (!takeFromBuffer()) {
    if (_interrupt.wait(_descriptor) == Interrupt::Wake::interrupted) return Got::interrupted;
    _buffer.resize(64u << 10);
    _at = 0;
    const ssize_t count = read(_descriptor, _buffer.data(), _buffer.size());
    _buffer.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
    if (count < 0 && errno != EINTR && errno != EAGAIN) return Got::failed;
    if (count == 0) return _begun ? finishLine() : Got::end;
  }
  return finishLine();
}

bool LineReader::takeFromBuffer() {
  if (_at == _buffer.size()) return false;
  _begun = true;
  const std::size_t lineBreak = _buffer.find('\n', _at);
  const std::size_t end = lineBreak == std::string::npos ? _buffer.size() : lineBreak;
  if (_tooLong || end - _at > _longest - _line.size()) {
    _tooLong = true;
    _line.clear();
  } else {
    _line.append(_buffer, _at, end - _at);
  }
  _at = lineBreak == std::string::npos ? end : end + 1;
  return lineBreak != std::string::npos;
}

LineReader::Got LineReader::finishLine() {
  ++_number;
  return _tooLong ? Got::tooLong : Got::line;
}

}  // namespace veltrad::ctl
