// SPDX-License-Identifier: Apache-2.0
// Preference domains: DOMAIN.plist under var/lib/veltrad/preferences, read at each use. Any thread.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"
#include "base/result.h"
#include "base/value.h"
#include "platform/file_store.h"

namespace veltrad::platform {

inline constexpr std::string_view kVeltraPreferenceDomain = "com.florn.veltra";
// The dates at which generated texts were made, a dictionary.
inline constexpr const char* kMadeAt = "madeAt";

class Preferences {
 public:
  virtual ~Preferences() = default;
  // Absent if nothing is stored. A failure is a shortage: it cannot be determined now.
  using Found = Result<std::optional<Value>, FileFailure>;
  virtual Found lookUp(std::string_view domain, std::string_view key) = 0;
  // The text under the key or, if there is none, `make()`, which is stored there; concurrent callers get the
  // same text. If it cannot be stored, it is kept until the process ends, and each call tries to store it
  // again. Absent during a shortage, when it cannot be determined what is stored.
  virtual std::optional<std::string> textOrStore(std::string_view domain, std::string_view key,
                                                 std::string (*make)()) = 0;

  // Absent also during a shortage.
  std::optional<Value> value(std::string_view domain, std::string_view key);
  // The same as a text; numbers and booleans are converted.
  std::optional<std::string> text(std::string_view domain, std::string_view key);
};

// Reads either form of property lists and writes the binary one. A file that is too large, malformed or not
// accessible is renamed to DOMAIN.plist.corrupt, with one error line, and defaults apply. A file that cannot
// be read for another lasting reason stays and is not overwritten; one error line, and defaults apply. During
// a shortage, the last content that was read is used if the file has not changed since.
class FilePreferences final : public Preferences {
 public:
  FilePreferences(FileStore& files, std::string directory);
  Found lookUp(std::string_view domain, std::string_view key) override;
  std::optional<std::string> textOrStore(std::string_view domain, std::string_view key,
                                         std::string (*make)()) override;
  // Stores the value, or takes the key away where there is none; other keys stay. The error is one line,
  // which was not logged.
  Result<Done, std::string> change(std::string_view domain, std::string_view key,
                                   const std::optional<Value>& value);
  // Changes many keys at once, and forgets the texts that could not be stored. `edit` gets all keys and is
  // called under the lock; it returns whether it has changed something. `what` names them in the error.
  using Edit = std::function<bool(Dictionary& all)>;
  Result<Done, std::string> edit(std::string_view domain, std::string_view what, const Edit& edit);
  // All keys of the domain.
  Result<Dictionary, FileFailure> all(std::string_view domain);

 private:
  // Error lines, logged after the lock was released.
  using Complaints = std::vector<std::string>;
  // The file's current content.
  Result<Dictionary, FileFailure> read(std::string_view domain, Complaints& complaints) REQUIRES(_mutex);
  // The same; during a shortage the last content if it is still current, and empty if the file cannot be read
  // for a lasting reason.
  Result<Dictionary, FileFailure> known(std::string_view domain, Complaints& complaints) REQUIRES(_mutex);
  Result<Dictionary, FileFailure> refused(const std::string& path, FileFailure failure, bool putAside,
                                          Complaints& complaints) REQUIRES(_mutex);
  // Also stores when the text was made.
  bool store(std::string_view domain, std::string_view key, const Value& value, Complaints& complaints)
      REQUIRES(_mutex);
  Result<Done, std::string> write(std::string_view domain, std::string_view what, const Edit& edit,
                                  Complaints& complaints) REQUIRES(_mutex);
  std::string pathOf(std::string_view domain) const;

  FileStore& _files;
  const std::string _directory;
  // Held while a file is read, changed and renamed.
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  struct Content {
    FileStamp stamp;
    Dictionary all;
  };
  // By path.
  std::map<std::string, Content> _lastRead GUARDED_BY(_mutex);
  // The texts that could not be stored, under "DOMAIN KEY".
  Dictionary _unstored GUARDED_BY(_mutex);
  // By path: the stamp of the file that the last error line was about.
  std::map<std::string, FileStamp> _complained GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
