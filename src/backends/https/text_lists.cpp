// List matching.
#include "backends/https/text_lists.h"

#include <algorithm>

#include "base/text.h"

namespace veltrad::backends {

bool matchExactStringWithList(const std::vector<std::string>& list,
                              const std::optional<std::string>& wholeString, bool whitelist) {
  if (list.empty()) return whitelist;
  if (!wholeString) return !whitelist;
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& item) { return equalIgnoringCase(item, *wholeString); });
}

bool matchStringWithList(const std::vector<std::string>& list, const std::optional<std::string>& wholeString,
                         bool whitelist) {
  if (list.empty()) return whitelist;
  if (!wholeString) return !whitelist;
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& item) { return containsIgnoringCase(*wholeString, item); });
}

std::vector<std::string> itemsBetweenCommas(const std::string* text) {
  std::vector<std::string> items;
  if (!text) return items;
  std::size_t start = 0;
  for (std::size_t comma; (comma = text->find(',', start)) != std::string::npos; start = comma + 1) {
    items.push_back(text->substr(start, comma - start));
  }
  items.push_back(text->substr(start));
  return items;
}

std::vector<std::string> textsOf(const Array* array) {
  std::vector<std::string> texts;
  if (!array) return texts;
  for (const Value& item : *array) {
    if (const std::string* text = item.asString()) texts.push_back(*text);
  }
  return texts;
}

bool matchClientNameAndServiceID(const Dictionary& entry, const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID) {
  return matchExactStringWithList(itemsBetweenCommas(entry.string("client")), clientName, true) &&
         matchStringWithList(itemsBetweenCommas(entry.string("service")), serviceID, true);
}

}  // namespace veltrad::backends
