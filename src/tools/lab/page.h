// The lab's live page. Any thread.
#pragma once

#include <string>

namespace veltrad::lab {

class Received;

// A plain page that loads itself anew every two seconds and lists the newest arrivals.
std::string livePage(const std::string& url, const Received& events, const Received& storebags);
// Text between tags: what comes from clients is never markup.
std::string escapedForHTML(const std::string& text);

}  // namespace veltrad::lab
