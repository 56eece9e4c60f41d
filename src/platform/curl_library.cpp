// Loading libcurl. Whichever thread makes the first request.
#include "platform/curl_library.h"

#include <dlfcn.h>

#include <cstdlib>

#include "platform/log.h"

namespace veltrad::platform {

namespace {

constexpr const char* kFile = "libcurl.so.4";

[[noreturn]] void fail() {
  const char* reason = dlerror();
  logError("libcurl cannot be loaded: %s", reason != nullptr ? reason : kFile);
  std::abort();
}

template <typename Function>
void find(void* library, const char* name, Function*& function) {
  function = reinterpret_cast<Function*>(dlsym(library, name));
  if (function == nullptr) fail();
}

}  // namespace

CurlLibrary::CurlLibrary() {
  void* library = dlopen(kFile, RTLD_LAZY | RTLD_LOCAL);
  if (library == nullptr) fail();
  find(library, "curl_global_init", globalInit);
  find(library, "curl_global_cleanup", globalCleanup);
  find(library, "curl_slist_append", slistAppend);
  find(library, "curl_slist_free_all", slistFreeAll);
  find(library, "curl_easy_init", easyInit);
  find(library, "curl_easy_setopt", easySetopt);
  find(library, "curl_easy_getinfo", easyGetinfo);
  find(library, "curl_easy_nextheader", easyNextheader);
  find(library, "curl_easy_strerror", easyStrerror);
  find(library, "curl_easy_reset", easyReset);
  find(library, "curl_easy_cleanup", easyCleanup);
  find(library, "curl_multi_init", multiInit);
  find(library, "curl_multi_setopt", multiSetopt);
  find(library, "curl_multi_add_handle", multiAddHandle);
  find(library, "curl_multi_remove_handle", multiRemoveHandle);
  find(library, "curl_multi_perform", multiPerform);
  find(library, "curl_multi_info_read", multiInfoRead);
  find(library, "curl_multi_poll", multiPoll);
  find(library, "curl_multi_wakeup", multiWakeup);
  find(library, "curl_multi_cleanup", multiCleanup);
}

}  // namespace veltrad::platform
