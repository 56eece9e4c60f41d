// The lab's own TLS certificate. Called once, at start, by the main thread.
#pragma once

#include <optional>
#include <string>

namespace veltrad::lab {

// Writes a new P-256 key (mode 0600) and a certificate that it signed itself, for localhost, 127.0.0.1 and
// ::1, good for ten years, both as PEM. Nothing: done; else one line that says what failed.
std::optional<std::string> makeCertificate(const std::string& certificatePath, const std::string& keyPath);

}  // namespace veltrad::lab
