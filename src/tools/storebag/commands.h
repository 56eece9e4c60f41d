// SPDX-License-Identifier: Apache-2.0
// The commands of veltra-storebag.
#pragma once

#include <string>

namespace veltrad::storebag {

// The text is the output, or says why the command was refused. With `findings` it lists what is wrong with
// the storebag.
struct Outcome {
  bool done = false;
  std::string text;
  bool findings = false;
};

// The files that keygen makes. The private key has mode 0600.
inline constexpr const char* kPrivateKeyFile = "privateKey.pem";
inline constexpr const char* kPublicKeyFile = "publicKey.der";

// Makes the directory if it is missing. Does nothing if either file exists.
Outcome keygen(const std::string& directory, int bits);
// `in` is a property list, whose bytes are signed unchanged, or JSON, which is converted into an XML property
// list. Refuses what the daemon would not accept.
Outcome sign(const std::string& privateKey, const std::string& in, const std::string& out);
// Refuses a container that the daemon would not accept, and says which step fails.
Outcome verify(const std::string& publicKey, const std::string& file);
// Prints the storebag of a container, without verification, or a bare storebag as JSON.
Outcome show(const std::string& file, bool compact);
// Lists the mistakes in the storebag of such a file, one per line, or says "nothing found".
Outcome lint(const std::string& file);

}  // namespace veltrad::storebag
