// Downloads the storebag of a client type and selects the section of the process's environment.
#pragma once

#include "config/storebag_download.h"
#include "config/storebag_source.h"

namespace veltrad::config {

// Keeps no state between calls, so any number of threads may call it. What the constructor takes must outlive
// it.
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
