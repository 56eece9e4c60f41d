// SPDX-License-Identifier: Apache-2.0
// The commands of veltra-storebag.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "storebag/given.h"

namespace veltrad::storebag {

// The text is the output, or says why the command was refused. With `findings` the output shows something
// that the caller asked for: mistakes, or a file that would change.
struct Outcome {
  bool done = false;
  std::string text;
  bool findings = false;
  // Further errors, one line each.
  std::vector<std::string> failures = {};
};

// The files that keygen makes. The private key has mode 0600.
inline constexpr const char* kPrivateKeyFile = "private.pem";
inline constexpr const char* kPublicKeyFile = "publicKey.der";
inline constexpr const char* kEd25519PrivateKeyFile = "ed25519.pem";
inline constexpr const char* kEd25519PublicKeyFile = "ed25519.der";

// Files are named; "-" is standard input.

// Makes the directory if it is missing. Does nothing if either file exists. Prints the fingerprint, too.
// `bits` is for RSA; `ed25519` makes an Ed25519 key instead.
Outcome keygen(const std::string& directory, int bits, bool ed25519 = false);

struct SignRequest {
  std::string privateKey, in, out;
  // Signs what lint calls an error, too.
  bool force = false;
  // Claims that are written into the storebag before it is signed.
  std::optional<std::int64_t> serial = {};
  std::optional<std::string> expires = {}, name = {};
  // Ed25519 private keys that sign as well.
  std::vector<std::string> ed25519 = {};
};
// `in` is a property list, whose bytes are signed unchanged unless something is written into it, or JSON,
// which is converted into an XML property list. Refuses what the daemon would not accept.
Outcome sign(const SignRequest& request);
// Refuses a container that the daemon would not accept, and says which step fails. `ed25519`: the public key
// of an Ed25519 signature that must be there, too; empty: none need be.
Outcome verify(const std::string& publicKey, const std::string& file, const std::string& ed25519 = {});
// The same of what was read from the file.
Outcome verifyBytes(const std::string& publicKey, const std::string& file, const std::string& bytes,
                    const std::string& ed25519 = {});
// Prints the storebag of a container, without verification, or a bare storebag as JSON.
Outcome show(const std::string& file, bool compact);

struct LintRequest {
  std::vector<std::string> files;
  // Names of findings that are left out.
  std::vector<std::string> allowed;
  // As in LintOptions.
  bool lab = false;
  bool json = false;
};
// Lists the findings in the storebags of such files, one per line, or says "nothing found". A file that
// cannot be read is a failure beside the findings in the others.
Outcome lint(const LintRequest& request);

struct FormatRequest {
  std::string file;
  bool write = false;
  // Says only whether the file would change.
  bool check = false;
};
// Lays out a storebag that is written as JSON.
Outcome format(const FormatRequest& request);
// Prints the JSON Schema of storebags.
Outcome schema();

// The session of an evaluation, and the files with further input.
struct SimulatedSession {
  Given given;
  std::optional<std::string> device, policy, messages;
};

struct ExplainRequest {
  std::string file;
  SimulatedSession session;
  std::vector<std::string> payload;
  std::optional<std::string> payloadFile;
  std::optional<std::uint16_t> category, type;
  std::int32_t flag = 0;
  bool json = false;
};
// Describes what each back end does with the messages of such a session.
Outcome explain(const ExplainRequest& request);

struct DiffRequest {
  std::string before, now;
  SimulatedSession session;
  bool json = false;
};
// Says what changes between two states of a storebag; `findings`: more leaves devices than before.
Outcome diff(const DiffRequest& request);

struct TestRequest {
  std::vector<std::string> suites;
  // Where the results are written in the form of JUnit.
  std::optional<std::string> junit;
  bool json = false;
};
// Runs suites of cases.
Outcome test(const TestRequest& request);

}  // namespace veltrad::storebag
