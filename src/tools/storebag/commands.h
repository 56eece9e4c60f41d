// What the commands of veltra-storebag do. One thread.
#pragma once

#include <string>

namespace veltrad::storebag {

// How a command ended: what belongs on standard output, or why it was refused.
struct Outcome {
  bool done = false;
  std::string text;
  bool findings = false;  // done, but the text says what is wrong with what it was given
};

// The files that keygen makes in its directory.
inline constexpr const char* kPrivateKeyFile = "privateKey.pem";  // mode 0600
inline constexpr const char* kPublicKeyFile = "publicKey.der";

// Makes the directory where it is missing; touches nothing when either file is there already.
Outcome keygen(const std::string& directory, int bits);
// `in`: a property list of either form, whose bytes are signed as they are, or JSON, which becomes a property
// list in XML form. Refuses what the daemon would not take: no dictionary, or beyond its bounds.
Outcome sign(const std::string& privateKey, const std::string& in, const std::string& out);
// Refuses a container that the daemon would not take, and says which step fails.
Outcome verify(const std::string& publicKey, const std::string& file);
// A container's storebag, unverified, or a bare storebag, as JSON.
Outcome show(const std::string& file, bool compact);
// What the storebag in such a file would do wrong, a line each, or "nothing found".
Outcome lint(const std::string& file);

}  // namespace veltrad::storebag
