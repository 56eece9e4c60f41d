// The lab's live page. Any thread.
#pragma once

#include <string>
#include <vector>

namespace veltrad::lab {

struct Arrivals;

// A plain page that loads itself anew every two seconds: the addresses of the servers, one a line, and the
// newest arrivals.
std::string livePage(const std::vector<std::string>& addresses, Arrivals& arrivals);
// Text between tags: what comes from clients is never markup.
std::string escapedForHTML(const std::string& text);

}  // namespace veltrad::lab
