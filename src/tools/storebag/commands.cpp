// SPDX-License-Identifier: Apache-2.0
// Makes keys; signs, verifies and shows storebags.
#include "storebag/commands.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "base/file_descriptor.h"
#include "config/storebag_container.h"
#include "config/storebag_key.h"
#include "config/storebag_signing.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "platform/file_store.h"
#include "storebag/lint.h"

namespace veltrad::storebag {
namespace {

Outcome done(std::string text) {
  return {true, std::move(text)};
}
Outcome refused(std::string text) {
  return {false, std::move(text)};
}

bool exists(const std::string& path) {
  struct stat found {};
  return ::lstat(path.c_str(), &found) == 0;
}

// Never replaces a file, even if it is made at the same time.
std::optional<std::string> writeNew(const std::string& path, const std::string& bytes, mode_t mode) {
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, mode));
  if (!file.isOpen()) return path + ": " + std::strerror(errno);
  const ssize_t written = ::write(file.get(), bytes.data(), bytes.size());
  if (written == static_cast<ssize_t>(bytes.size()) && ::fsync(file.get()) == 0) return std::nullopt;
  ::unlink(path.c_str());
  return path + ": could not be written";
}

}  // namespace

Outcome keygen(const std::string& directory, int bits) {
  const std::string privatePath = directory + "/" + kPrivateKeyFile;
  const std::string publicPath = directory + "/" + kPublicKeyFile;
  for (const std::string& path : {privatePath, publicPath})
    if (exists(path)) return refused(path + ": exists already; keys are never overwritten");
  if (const auto made = platform::makeDirectories(directory); !made) return refused(made.error().description);
  const config::SigningKey key = config::SigningKey::generate(bits);
  if (const auto failure = writeNew(privatePath, key.privatePEM(), 0600)) return refused(*failure);
  if (const auto failure = writeNew(publicPath, key.publicDER(), 0644)) {
    ::unlink(privatePath.c_str());
    return refused(*failure);
  }
  return done(fmt::format("{}\n{}\n", privatePath, publicPath));
}

Outcome sign(const SignRequest& request) {
  const auto key = config::SigningKey::load(request.privateKey);
  if (!key) return refused(key.error());
  const auto bag = readStorebag(request.in);
  if (!bag) return refused(bag.error().line());
  if (bag.value().signedContainer)
    return refused(request.in + ": is signed already; \"veltra-storebag show\" prints the storebag in it");
  if (!request.force) {
    if (std::string errors = errorsIn(bag.value()); !errors.empty())
      return refused(errors + "\n--force signs it all the same");
  }
  const Document& document = bag.value().document;
  const std::string bytes = document.form == Document::Form::json
                                ? formats::writeXMLPropertyList(document.content)
                                : document.bytes;
  if (!config::parseStorebagBag(bytes))
    return refused(
        fmt::format("{}: beyond what the daemon takes of a storebag: {}", request.in, boundsOfStorebags()));
  const std::string container = config::makeStorebagContainerAround(key.value(), bytes);
  if (!config::parseStorebagContainer(container))
    return refused(fmt::format("{}: signed it has {} bytes; the daemon takes {}", request.in,
                               container.size(), config::kStorebagMostContainerBytes));
  platform::DiskFileStore files;
  if (const auto written = files.replace(request.out, container, 0644); !written)
    return refused(written.error().description);
  return done("");
}

Outcome verify(const std::string& publicKey, const std::string& file) {
  platform::DiskFileStore files;
  const auto der = files.read(publicKey, config::kStorebagMostContainerBytes);
  if (!der) return refused(der.error().description);
  const std::optional<config::StorebagKey> key = config::StorebagKey::fromDER(der.value());
  if (!key)
    return refused(fmt::format("{}: expected an RSA public key in DER form of {} to {} bits", publicKey,
                               config::StorebagKey::kFewestModulusBits,
                               config::StorebagKey::kMostModulusBits));
  const auto bytes = readBytes(file);
  if (!bytes) return refused(bytes.error());
  const auto container = config::parseStorebagContainer(bytes.value());
  if (!container)
    return refused(file + ": the container is no property list: " + container.error().description());
  if (!container.value().signature) return refused(file + ": the text \"signature\" is missing");
  if (!container.value().bag) return refused(file + ": the text \"bag\" is missing");
  const std::optional<config::SignedStorebag> decoded = config::decodeStorebagContainer(container.value());
  if (!decoded) return refused(file + ": \"signature\" or \"bag\" is no base64");
  const std::size_t expected = static_cast<std::size_t>(key->modulusBits() + 7) / 8;
  if (decoded->signature.size() != expected)
    return refused(fmt::format("{}: the signature has {} bytes; one of this key has {}", file,
                               decoded->signature.size(), expected));
  if (!key->verifies(decoded->bag, decoded->signature))
    return refused(file + ": the signature is not this key's over this bag");
  if (!config::parseStorebagBag(decoded->bag))
    return refused(fmt::format("{}: signed, but the bag is no property list of a dictionary within {}", file,
                               boundsOfStorebags()));
  return done(file + ": the signature holds\n");
}

Outcome show(const std::string& file, bool compact) {
  const auto bag = readStorebag(file);
  if (!bag) return refused(bag.error().line());
  std::string json = formats::writeJSON(bag.value().storebag,
                                        compact ? formats::JSONStyle::compact : formats::JSONStyle::pretty);
  if (!json.ends_with('\n')) json += '\n';
  return done(std::move(json));
}

}  // namespace veltrad::storebag
