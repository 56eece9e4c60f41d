// SPDX-License-Identifier: Apache-2.0
// Parses URLs with libcurl. Any thread.
#include "http/host_name.h"

#include <curl/curl.h>

#include <memory>

namespace veltrad::http {

std::string hostName(const std::string& url) {
  const std::unique_ptr<CURLU, decltype(&curl_url_cleanup)> parsed(curl_url(), curl_url_cleanup);
  char* host = nullptr;
  if (!parsed || curl_url_set(parsed.get(), CURLUPART_URL, url.c_str(), 0) != CURLUE_OK ||
      curl_url_get(parsed.get(), CURLUPART_HOST, &host, CURLU_URLDECODE) != CURLUE_OK)
    return "";
  const std::unique_ptr<char, decltype(&curl_free)> owned(host, curl_free);
  return host;
}

std::string_view addressOf(std::string_view url) {
  const std::size_t slashes = url.find("//");
  return url.substr(0, url.find_first_of("/?#", slashes == std::string_view::npos ? 0 : slashes + 2));
}

std::string_view authorityOf(std::string_view url) {
  const std::string_view address = addressOf(url);
  const std::size_t slashes = address.find("//");
  return slashes == std::string_view::npos ? address : address.substr(slashes + 2);
}

}  // namespace veltrad::http
