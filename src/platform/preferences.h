// Preference domains: DOMAIN.plist under var/lib/veltrad/preferences, read at use. Any thread.
#pragma once

#include <cstdint>
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

class Preferences {
 public:
  virtual ~Preferences() = default;
  // Nothing stored: nothing. A failure is a shortage: for now nobody can say.
  using Found = Result<std::optional<Value>, FileFailure>;
  virtual Found lookUp(std::string_view domain, std::string_view key) = 0;
  // False when it could not be stored; one error line has said why.
  virtual bool setValue(std::string_view domain, std::string_view key, const Value& value) = 0;
  // The text under the key, or `make()` stored there; one hold of the lock, so two callers get one text. When
  // the store cannot be written, the text lasts as long as the process, and each call tries to store it
  // again. Nothing: for a shortage nobody can say what is stored, so nothing was made.
  virtual std::optional<std::string> textOrStore(std::string_view domain, std::string_view key,
                                                 std::string (*make)()) = 0;

  // Nothing also where nobody can say for now.
  std::optional<Value> value(std::string_view domain, std::string_view key);
  // A stored number or boolean yields its decimal text.
  std::optional<std::string> text(std::string_view domain, std::string_view key);
};

// Either property list form is read; the binary form is written. A file that is too large, malformed or
// closed to the daemon is renamed to DOMAIN.plist.corrupt, defaults serve and one error line says so. One
// that cannot be read for another reason stays: one error line, defaults serve, nothing is stored over it.
// During a shortage what was last read serves where the file has not changed since.
class FilePreferences final : public Preferences {
 public:
  FilePreferences(FileStore& files, std::string directory);
  Found lookUp(std::string_view domain, std::string_view key) override;
  bool setValue(std::string_view domain, std::string_view key, const Value& value) override;
  std::optional<std::string> textOrStore(std::string_view domain, std::string_view key,
                                         std::string (*make)()) override;
  // Stores the value, or takes the key away where there is none; other keys stay. The error is one line,
  // which was not logged.
  Result<Done, std::string> change(std::string_view domain, std::string_view key,
                                   const std::optional<Value>& value);

 private:
  using Complaints = std::vector<std::string>;  // error lines, logged when the lock is released
  // The file as it is now.
  Result<Dictionary, FileFailure> read(std::string_view domain, Complaints& complaints) REQUIRES(_mutex);
  // What callers are answered from: during a shortage the content that is known to be the file's, and where
  // it cannot be read for a lasting reason, nothing.
  Result<Dictionary, FileFailure> known(std::string_view domain, Complaints& complaints) REQUIRES(_mutex);
  Result<Dictionary, FileFailure> refused(const std::string& path, FileFailure failure, bool putAside,
                                          Complaints& complaints) REQUIRES(_mutex);
  bool store(std::string_view domain, std::string_view key, const Value& value, Complaints& complaints)
      REQUIRES(_mutex);
  Result<Done, std::string> write(std::string_view domain, std::string_view key,
                                  const std::optional<Value>& value, Complaints& complaints) REQUIRES(_mutex);
  std::string pathOf(std::string_view domain) const;

  FileStore& _files;
  const std::string _directory;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};  // around read, change, rename
  struct Content {
    FileStamp stamp;
    Dictionary all;
  };
  std::map<std::string, Content> _lastRead GUARDED_BY(_mutex);  // by path
  // "DOMAIN KEY" of texts that could not be stored.
  Dictionary _unstored GUARDED_BY(_mutex);
  // By path: the stamp of the file that the last error line was about.
  std::map<std::string, FileStamp> _complained GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
