// Preference domains: DOMAIN.plist under var/lib/veltrad/preferences, read at use. Any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::platform {

class FileStore;

inline constexpr std::string_view kVeltraPreferenceDomain = "com.florn.veltra";

class Preferences {
 public:
  virtual ~Preferences() = default;
  virtual std::optional<Value> value(std::string_view domain, std::string_view key) = 0;
  // False when it could not be stored; one error line has said why.
  virtual bool setValue(std::string_view domain, std::string_view key, const Value& value) = 0;
  // The text under the key, or `make()` stored there; one hold of the lock, so two callers get one text. When the
  // store cannot be written, the text lasts as long as the process.
  virtual std::string textOrStore(std::string_view domain, std::string_view key, std::string (*make)()) = 0;

  // A stored number or boolean yields its decimal text.
  std::optional<std::string> text(std::string_view domain, std::string_view key);
};

// Either property list form is read; the binary form is written. An unreadable file is renamed to DOMAIN.plist.corrupt,
// defaults serve and one error line says so.
class FilePreferences final : public Preferences {
 public:
  FilePreferences(FileStore& files, std::string directory);
  std::optional<Value> value(std::string_view domain, std::string_view key) override;
  bool setValue(std::string_view domain, std::string_view key, const Value& value) override;
  std::string textOrStore(std::string_view domain, std::string_view key, std::string (*make)()) override;

 private:
  Dictionary read(std::string_view domain) REQUIRES(_mutex);
  bool write(std::string_view domain, const Dictionary& all) REQUIRES(_mutex);

  FileStore& _files;
  const std::string _directory;
  Mutex _mutex{LockRank::leaf};  // around read, change, rename
  Dictionary _unstored GUARDED_BY(_mutex);  // "DOMAIN KEY" of texts that could not be stored
};

}  // namespace veltrad::platform
