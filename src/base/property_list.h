// Binary property lists (version "bplist00": a table of offsets, trailer first), both directions, and what
// every reader of property lists is bounded by. Pure functions from bytes to values and back.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/text.h"
#include "base/value.h"

namespace veltrad {

// What a reader spends at most on one property list; whatever the bytes say, nothing is allocated from a
// count that the list declares before it was checked against the bytes that are there. The numbers keep any
// list under 1 MiB within 16 MiB of memory: an object takes up to 128 bytes beside its text.
struct PropertyListLimits {
  std::size_t bytes = 64u << 20;     // length of the whole list
  int depth = 64;                    // nesting of arrays and dictionaries, the outermost being 1
  std::size_t objects = 65'536;      // values made, a shared object counted at each place where it stands
  std::size_t textBytes = 6u << 20;  // bytes of all keys, texts and data made, shared ones at each place
  std::size_t memory = static_cast<std::size_t>(-1);  // keptBytes() of the value made; the binary form alone
};

struct PropertyListError {
  enum class Kind {
    notAPropertyList,  // neither form
    malformed,         // the form is broken; detail says where
    tooDeep,
    tooLarge,    // bytes, objects or text beyond the limits
    overMemory,  // what is made would keep more than the limit: more of it may do
    cyclic,
    forbidden,  // XML: a document type with an internal subset, an entity, an external reference
  };
  Kind kind;
  std::string detail;                   // one line for the log: what is wrong
  std::optional<TextPlace> place = {};  // where, in an XML list; in a binary one the detail names the object
  // Both, as one line.
  std::string description() const;
};

Result<Value, PropertyListError> parseBinaryPropertyList(std::string_view bytes,
                                                         const PropertyListLimits& limits = {});

// The objects that the trailer of a binary list counts, shared ones once; nothing: there is no such trailer.
std::optional<std::uint64_t> declaredObjects(std::string_view bytes);
// As the limits count them: the value, and the keys and values of all containers in it, each where it stands.
std::size_t objectsIn(const Value& value);

// Texts that are no UTF-8 are mended, each wrong byte becoming U+FFFD.
std::string writeBinaryPropertyList(const Value& value);
// Appends to `out`, so that a caller can put a header in front without a copy.
void appendBinaryPropertyList(const Value& value, std::string& out);

}  // namespace veltrad
