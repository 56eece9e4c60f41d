// Preference domains: DOMAIN.plist under var/lib/veltrad/preferences, read at use. Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

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
  // The text under the key, or `make()` stored there; one hold of the lock, so two callers get one text. When
  // the store cannot be written, the text lasts as long as the process.
  virtual std::string textOrStore(std::string_view domain, std::string_view key, std::string (*make)()) = 0;

  // A stored number or boolean yields its decimal text.
  std::optional<std::string> text(std::string_view domain, std::string_view key);
};

// Either property list form is read; the binary form is written. A file that is too large, malformed or
// closed to the daemon is renamed to DOMAIN.plist.corrupt, defaults serve and one error line says so. One
// that cannot be read for want of something else (descriptors, memory) stays: one error line, defaults serve,
// nothing is stored over it.
class FilePreferences final : public Preferences {
 public:
  FilePreferences(FileStore& files, std::string directory);
  std::optional<Value> value(std::string_view domain, std::string_view key) override;
  bool setValue(std::string_view domain, std::string_view key, const Value& value) override;
  std::string textOrStore(std::string_view domain, std::string_view key, std::string (*make)()) override;

 private:
  using Complaints = std::vector<std::string>;  // error lines, logged when the lock is released
  // Nothing: the file is there and could not be read.
  std::optional<Dictionary> read(std::string_view domain, Complaints& complaints) REQUIRES(_mutex);
  std::optional<Dictionary> refused(const std::string& path, const std::string& why, bool putAside,
                                    Complaints& complaints) REQUIRES(_mutex);
  bool store(std::string_view domain, std::string_view key, const Value& value, Complaints& complaints)
      REQUIRES(_mutex);
  std::string pathOf(std::string_view domain) const;

  FileStore& _files;
  const std::string _directory;
  Mutex _mutex{LockRank::leaf};  // around read, change, rename
  // "DOMAIN KEY" of texts that could not be stored.
  Dictionary _unstored GUARDED_BY(_mutex);
  // By path: the stamp of the file that the last error line was about.
  std::map<std::string, std::optional<std::uint64_t>> _complained GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
