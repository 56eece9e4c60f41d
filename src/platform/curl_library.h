// libcurl, loaded with the first request. HTTP thread; waking from any thread.
#pragma once

#include <curl/curl.h>

namespace veltrad::platform {

// Linked in, libcurl and the libraries that it alone needs would add 4 MiB to a daemon that never posts. The
// members are its functions. It stays loaded until the process ends.
class CurlLibrary {
 public:
  CurlLibrary();  // aborts with a log line where libcurl cannot be loaded

  decltype(&::curl_global_init) globalInit;
  decltype(&::curl_global_cleanup) globalCleanup;
  decltype(&::curl_slist_append) slistAppend;
  decltype(&::curl_slist_free_all) slistFreeAll;
  decltype(&::curl_easy_init) easyInit;
  decltype(&::curl_easy_setopt) easySetopt;
  decltype(&::curl_easy_getinfo) easyGetinfo;
  decltype(&::curl_easy_nextheader) easyNextheader;
  decltype(&::curl_easy_strerror) easyStrerror;
  decltype(&::curl_easy_reset) easyReset;
  decltype(&::curl_easy_cleanup) easyCleanup;
  decltype(&::curl_multi_init) multiInit;
  decltype(&::curl_multi_setopt) multiSetopt;
  decltype(&::curl_multi_add_handle) multiAddHandle;
  decltype(&::curl_multi_remove_handle) multiRemoveHandle;
  decltype(&::curl_multi_perform) multiPerform;
  decltype(&::curl_multi_info_read) multiInfoRead;
  decltype(&::curl_multi_poll) multiPoll;
  decltype(&::curl_multi_wakeup) multiWakeup;
  decltype(&::curl_multi_cleanup) multiCleanup;
};

}  // namespace veltrad::platform
