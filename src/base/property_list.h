// SPDX-License-Identifier: Apache-2.0
// Reads and writes binary property lists (version "bplist00"), and states the limits of every reader of
// property lists.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/text.h"
#include "base/value.h"

namespace veltrad {

// Limits for reading one property list. A count that the list declares is checked against the bytes that are
// present before anything is allocated for it. The defaults keep any list under 1 MiB within 16 MiB of
// memory: an object takes up to 128 bytes besides its text. A shared object counts at each place where it
// occurs.
struct PropertyListLimits {
  // Length of the list.
  std::size_t bytes = 64u << 20;
  // Nesting of arrays and dictionaries; the outermost is 1.
  int depth = 64;
  std::size_t objects = 65'536;
  // Of all keys, texts and data.
  std::size_t textBytes = 6u << 20;
  // keptBytes() of the value; checked for the binary form only.
  std::size_t memory = static_cast<std::size_t>(-1);
};

struct PropertyListError {
  // tooLarge: more bytes, objects or text than the limits. overMemory: the memory limit was reached; a higher
  // one may suffice. forbidden: in XML, a document type with an internal subset, an entity or an external
  // reference.
  enum class Kind { notAPropertyList, malformed, tooDeep, tooLarge, overMemory, cyclic, forbidden };
  Kind kind;
  std::string detail;                   // one line for the log: what is wrong
  std::optional<TextPlace> place = {};  // where, in an XML list; in a binary one the detail names the object
  // Both, as one line.
  std::string description() const;
};

Result<Value, PropertyListError> parseBinaryPropertyList(std::string_view bytes,
                                                         const PropertyListLimits& limits = {});

// The number of objects that the trailer of a binary list declares, shared ones counted once. Absent without
// a trailer.
std::optional<std::uint64_t> declaredObjects(std::string_view bytes);
// The number of objects as the limits count them: the value, and all keys and values in it.
std::size_t objectsIn(const Value& value);

// In texts that are not valid UTF-8, each invalid byte becomes U+FFFD.
std::string writeBinaryPropertyList(const Value& value);
// The same, appended to `out`.
void appendBinaryPropertyList(const Value& value, std::string& out);

}  // namespace veltrad
