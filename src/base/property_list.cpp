// Tells the two forms of property lists apart. Any thread.
#include "base/property_list.h"

namespace veltrad {

namespace {

// A byte order mark, blanks, then markup. In UTF-16 every other byte of such a beginning is zero.
bool looksLikeXML(std::string_view bytes) {
  if (bytes.starts_with("\xFE\xFF") || bytes.starts_with("\xFF\xFE")) return true;
  if (bytes.starts_with("\xEF\xBB\xBF")) bytes.remove_prefix(3);
  const std::size_t start = bytes.find_first_not_of(" \t\r\n");
  return start != std::string_view::npos && bytes[start] == '<';
}

}  // namespace

Result<Value, PropertyListError> parsePropertyList(std::string_view bytes, const PropertyListLimits& limits) {
  if (bytes.starts_with("bplist")) return parseBinaryPropertyList(bytes, limits);
  if (looksLikeXML(bytes)) return parseXMLPropertyList(bytes, limits);
  return Failure{PropertyListError{PropertyListError::Kind::notAPropertyList,
                                   bytes.empty()
                                       ? "no bytes, where a property list was expected"
                                       : "neither \"bplist00\" nor XML, where a property list was expected"}};
}

}  // namespace veltrad
