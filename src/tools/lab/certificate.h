// SPDX-License-Identifier: Apache-2.0
// The lab's own TLS certificate.
#pragma once

#include <optional>
#include <string>

namespace veltrad::lab {

// Writes a new P-256 key (mode 0600) and a self-signed certificate for localhost, 127.0.0.1 and ::1, valid
// for ten years, both as PEM. Returns one line that says what failed, if anything did.
std::optional<std::string> makeCertificate(const std::string& certificatePath, const std::string& keyPath);

}  // namespace veltrad::lab
