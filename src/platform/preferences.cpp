// Preference domains as property list files. Any thread; the lock is held around read, change and rename.
#include "platform/preferences.h"

#include <utility>

#include "base/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::platform {

namespace {

void logAll(const std::vector<std::string>& complaints) {
  for (const std::string& line : complaints) logError("%s", line.c_str());
}

std::string nameOf(std::string_view domain, std::string_view key) {
  return std::string(domain) + " " + std::string(key);
}

}  // namespace

std::optional<std::string> Preferences::text(std::string_view domain, std::string_view key) {
  const auto found = value(domain, key);
  return found ? found->toText() : std::nullopt;
}

FilePreferences::FilePreferences(FileStore& files, std::string directory)
    : _files(files), _directory(std::move(directory)) {}

std::optional<Value> FilePreferences::value(std::string_view domain, std::string_view key) {
  Complaints complaints;
  std::optional<Value> found;
  {
    Lock lock(_mutex);
    const auto all = read(domain, complaints);
    const Value* stored = all ? all->find(key) : nullptr;
    if (!stored) stored = _unstored.find(nameOf(domain, key));
    if (stored) found = *stored;
  }
  logAll(complaints);
  return found;
}

bool FilePreferences::setValue(std::string_view domain, std::string_view key, const Value& value) {
  Complaints complaints;
  bool stored = false;
  {
    Lock lock(_mutex);
    stored = store(domain, key, value, complaints);
  }
  logAll(complaints);
  return stored;
}

std::string FilePreferences::textOrStore(std::string_view domain, std::string_view key,
                                         std::string (*make)()) {
  Complaints complaints;
  std::string text;
  {
    Lock lock(_mutex);
    const auto all = read(domain, complaints);
    const Value* found = all ? all->find(key) : nullptr;
    if (const auto stored = found ? found->toText() : std::nullopt) text = *stored;
    if (text.empty()) {
      if (const std::string* unstored = _unstored.string(nameOf(domain, key))) text = *unstored;
    }
    if (text.empty()) {
      text = make();
      if (!store(domain, key, text, complaints)) _unstored.set(nameOf(domain, key), text);
    }
  }
  logAll(complaints);
  return text;
}

std::string FilePreferences::pathOf(std::string_view domain) const {
  return _directory + "/" + std::string(domain) + ".plist";
}

std::optional<Dictionary> FilePreferences::read(std::string_view domain, Complaints& complaints) {
  const std::string path = pathOf(domain);
  const auto bytes = _files.read(path);
  if (!bytes) {
    const FileFailure& failure = bytes.error();
    if (failure.kind == FileFailure::Kind::notFound) return Dictionary();
    const bool ofTheFile =
        failure.kind == FileFailure::Kind::noAccess || failure.kind == FileFailure::Kind::tooLarge;
    return refused(path, failure.description, ofTheFile, complaints);
  }
  const auto list = parsePropertyList(bytes.value());
  if (!list) return refused(path, path + ": " + list.error().detail, true, complaints);
  const Dictionary* all = list.value().asDictionary();
  if (!all) return refused(path, path + ": the outermost value is not a dictionary", true, complaints);
  return *all;
}

// What serves instead of the file: an empty domain once it was put aside, else nothing.
std::optional<Dictionary> FilePreferences::refused(const std::string& path, const std::string& why,
                                                   bool putAside, Complaints& complaints) {
  const auto stamp = _files.stamp(path);
  const bool said = _complained.contains(path) && _complained[path] == stamp;
  const auto failure = putAside ? _files.rename(path, path + ".corrupt") : std::nullopt;
  std::string line = "Preferences could not be read, defaults serve: " + why;
  if (putAside) line += failure ? "; not renamed, " + failure->description : "; kept as " + path + ".corrupt";
  if (!said) complaints.push_back(std::move(line));
  _complained[path] = stamp;
  if (!putAside || failure) return std::nullopt;
  return Dictionary();
}

bool FilePreferences::store(std::string_view domain, std::string_view key, const Value& value,
                            Complaints& complaints) {
  const std::string path = pathOf(domain);
  auto all = read(domain, complaints);
  if (!all) {
    complaints.push_back("Preference not stored, its file cannot be read: " + path + ", " + std::string(key));
    return false;
  }
  all->set(std::string(key), value);
  const auto failure = _files.replace(path, writeBinaryPropertyList(*all));
  if (!failure) return true;
  complaints.push_back("Preference not stored: " + failure->description + ", " + std::string(key));
  return false;
}

}  // namespace veltrad::platform
