// Picks from a client type's storebag the section of the process's environment. The caller's thread.
#pragma once

#include "config/storebag_download.h"
#include "config/storebag_source.h"

namespace veltrad::config {

// The real source: downloads the storebag at each call. Keeps no state; any number of threads at once. What
// the constructor takes must outlive it.
class StorebagSections final : public StorebagSource {
 public:
  StorebagSections(http::HTTPClient& http, ProcessSettings& settings, const support::Veltra& veltra);

  StorebagSectionAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, const std::optional<std::string>& lastModified) override;

 private:
  ProcessSettings& _settings;
  StorebagDownload _download;
};

}  // namespace veltrad::config
