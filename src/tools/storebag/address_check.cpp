// SPDX-License-Identifier: Apache-2.0
// Parses and checks addresses.
#include "storebag/address_check.h"

#include <arpa/inet.h>
#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <charconv>

#include "base/text.h"
#include "http/host_name.h"

namespace veltrad::storebag {
namespace {

constexpr std::string_view kScheme = "https://";

bool isBlankOrControl(char c) {
  const auto code = static_cast<unsigned char>(c);
  return code <= ' ' || code == 0x7F;
}

AddressFault noHTTPS(const std::string& address) {
  std::string rest = address;
  const std::size_t scheme = address.find("://");
  if (scheme != std::string::npos) rest.erase(0, scheme + 3);
  // "https:/host", "https//host"
  const std::size_t slash = std::min(rest.find('/'), rest.size());
  const std::string word = lowerCase(rest.substr(0, slash));
  if (word == "http:" || word == "https:" || word == "http" || word == "https")
    rest.erase(0, std::min(rest.find_first_not_of('/', slash), rest.size()));
  return {FindingName::not_https, "does not begin with https://, and nothing is sent to it",
          fmt::format("Write \"https://{}\".", rest)};
}

// Checks the part after the host: ":8443".
bool isPort(std::string_view text) {
  if (text.empty()) return true;
  unsigned port = 0;
  const auto [end, error] = std::from_chars(text.data() + 1, text.data() + text.size(), port);
  return text.front() == ':' && error == std::errc() && end == text.data() + text.size() && port >= 1 &&
         port <= 65'535;
}

}  // namespace

std::optional<AddressFault> faultOfAddress(const std::string& address) {
  using enum FindingName;
  if (address.empty()) return AddressFault{bad_address, "is empty", "Write https://HOST/PATH."};
  if (std::any_of(address.begin(), address.end(), isBlankOrControl))
    return AddressFault{bad_address, "holds a blank", "Take the blank out; inside a path it is written %20."};
  if (!lowerCase(address).starts_with(kScheme)) return noHTTPS(address);
  const std::string_view rest = std::string_view(address).substr(kScheme.size());
  std::string_view authority = rest.substr(0, rest.find_first_of("/?#"));
  if (authority.find('@') != std::string_view::npos)
    return AddressFault{credentials_in_address, "names a user or a password, which everyone can read",
                        "Take the part before the @ out."};
  // An IPv6 address stands in brackets.
  const std::size_t bracket = authority.starts_with('[') ? authority.find(']') : 0;
  const std::size_t colon =
      bracket == std::string_view::npos ? authority.size() : authority.find(':', bracket);
  const std::string_view host = authority.substr(0, colon);
  if (host.empty()) return AddressFault{bad_address, "has no host", "Write https://HOST/PATH."};
  if (host.front() == '.' || host.find("..") != std::string_view::npos)
    return AddressFault{bad_address, "has a host with a dot too many", "Take the dot out."};
  if (colon != std::string_view::npos && !isPort(authority.substr(colon)))
    return AddressFault{bad_address, "has a port that is none", "Write a port from 1 to 65535, or none."};
  if (http::hostName(address).empty())
    return AddressFault{bad_address, "is no address", "Write https://HOST/PATH."};
  return std::nullopt;
}

std::optional<AddressFault> faultOfIPv4(const std::string& address) {
  in_addr parsed{};
  if (inet_pton(AF_INET, address.c_str(), &parsed) == 1) return std::nullopt;
  const bool isName =
      std::any_of(address.begin(), address.end(), [](unsigned char c) { return std::isalpha(c) != 0; });
  return AddressFault{FindingName::dashboard_address,
                      isName ? "is no IPv4 address, and names are not resolved" : "is no IPv4 address",
                      "Write four numbers from 0 to 255, like \"192.0.2.7\"; the port stands in \"port\"."};
}

}  // namespace veltrad::storebag
