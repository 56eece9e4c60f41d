// SPDX-License-Identifier: Apache-2.0
// Preference domains as property list files.
#include "platform/preferences.h"

#include <chrono>
#include <utility>

#include "formats/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::platform {

namespace {

std::string nameOf(std::string_view domain, std::string_view key) {
  return std::string(domain) + " " + std::string(key);
}

}  // namespace

std::optional<Value> Preferences::value(std::string_view domain, std::string_view key) {
  auto found = lookUp(domain, key);
  return found ? std::move(found).value() : std::nullopt;
}

std::optional<std::string> Preferences::text(std::string_view domain, std::string_view key) {
  const auto found = value(domain, key);
  return found ? found->toText() : std::nullopt;
}

FilePreferences::FilePreferences(FileStore& files, std::string directory)
    : _files(files), _directory(std::move(directory)) {}

Preferences::Found FilePreferences::lookUp(std::string_view domain, std::string_view key) {
  LateErrors late;
  const Lock lock(_mutex);
  const auto all = known(domain, late.lines);
  const Value* value = all ? all.value().find(key) : nullptr;
  if (!value) value = _unstored.find(nameOf(domain, key));
  if (value) return std::optional(*value);
  if (!all) return Failure{all.error()};
  return std::optional<Value>();
}

Result<Done, std::string> FilePreferences::change(std::string_view domain, std::string_view key,
                                                  const std::optional<Value>& value) {
  LateErrors late;
  const Lock lock(_mutex);
  auto written = write(
      domain, key,
      [&](Dictionary& all) {
        if (!value) return all.erase(key);
        all.set(std::string(key), *value);
        return true;
      },
      late.lines);
  if (written) _unstored.erase(nameOf(domain, key));
  return written;
}

Result<Done, std::string> FilePreferences::edit(std::string_view domain, std::string_view what,
                                                const Edit& edit) {
  LateErrors late;
  const Lock lock(_mutex);
  auto written = write(domain, what, edit, late.lines);
  if (written) _unstored = {};
  return written;
}

Result<Dictionary, FileFailure> FilePreferences::all(std::string_view domain) {
  LateErrors late;
  const Lock lock(_mutex);
  return known(domain, late.lines);
}

std::optional<std::string> FilePreferences::textOrStore(std::string_view domain, std::string_view key,
                                                        std::string (*make)()) {
  LateErrors late;
  const Lock lock(_mutex);
  const auto all = known(domain, late.lines);
  const Value* found = all ? all.value().find(key) : nullptr;
  auto text = found ? found->toText() : std::nullopt;
  if (text && !text->empty()) return text;
  const std::string name = nameOf(domain, key);
  if (const std::string* unstored = _unstored.string(name)) {
    text = *unstored;
    Complaints said;  // not logged: this was done when the text was made
    if (store(domain, key, *text, said)) _unstored.erase(name);
    return text;
  }
  if (!all) return std::nullopt;
  text = make();
  if (!store(domain, key, *text, late.lines)) _unstored.set(name, *text);
  return text;
}

std::string FilePreferences::pathOf(std::string_view domain) const {
  return _directory + "/" + std::string(domain) + ".plist";
}

Result<Dictionary, FileFailure> FilePreferences::known(std::string_view domain, Complaints& complaints) {
  const std::string path = pathOf(domain);
  const auto stamp = _files.stamp(path);  // first, so that a file that changes while it is read is read again
  auto all = read(domain, complaints);
  if (all) {
    if (stamp) {
      _lastRead[path] = {stamp.value(), all.value()};
    } else {
      _lastRead.erase(path);
    }
    return all;
  }
  if (!all.error().passes()) return Dictionary();
  const auto last = _lastRead.find(path);
  if (last != _lastRead.end() && stamp && stamp.value() == last->second.stamp) return last->second.all;
  return all;
}

Result<Dictionary, FileFailure> FilePreferences::read(std::string_view domain, Complaints& complaints) {
  const std::string path = pathOf(domain);
  const auto bytes = _files.read(path);
  if (!bytes) {
    const FileFailure& failure = bytes.error();
    if (failure.kind == FileFailure::Kind::notFound) return Dictionary();
    if (failure.passes()) return Failure{failure};
    const bool ofTheFile =
        failure.kind == FileFailure::Kind::noAccess || failure.kind == FileFailure::Kind::tooLarge;
    return refused(path, failure, ofTheFile, complaints);
  }
  const auto list = formats::parsePropertyList(bytes.value());
  const Dictionary* all = list ? list.value().asDictionary() : nullptr;
  if (all) return *all;
  const std::string why = list ? "the outermost value is not a dictionary" : list.error().description();
  return refused(path, {FileFailure::Kind::other, path + ": " + why}, true, complaints);
}

// The content that replaces an unusable file: an empty domain if the file was put aside, else a failure.
Result<Dictionary, FileFailure> FilePreferences::refused(const std::string& path, FileFailure why,
                                                         bool putAside, Complaints& complaints) {
  const auto stamp = _files.stamp(path);
  if (!stamp) return Failure{stamp.error()};
  const bool said = _complained.contains(path) && _complained[path] == stamp.value();
  const auto renamed = putAside ? _files.rename(path, path + ".corrupt") : Done();
  std::string line = "Preferences could not be read, defaults serve: " + why.description;
  if (putAside)
    line += renamed ? "; kept as " + path + ".corrupt" : "; not renamed, " + renamed.error().description;
  if (!said) complaints.push_back(std::move(line));
  _complained[path] = stamp.value();
  if (!putAside || !renamed) return Failure{std::move(why)};
  return Dictionary();
}

bool FilePreferences::store(std::string_view domain, std::string_view key, const Value& value,
                            Complaints& complaints) {
  const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
  const auto stored = write(
      domain, key,
      [&](Dictionary& all) {
        const Dictionary* before = all.dictionary(kMadeAt);
        Dictionary times = before ? *before : Dictionary();
        times.set(std::string(key), Date{now.count()});
        all.set(kMadeAt, std::move(times));
        all.set(std::string(key), value);
        return true;
      },
      complaints);
  if (!stored) complaints.push_back(stored.error());
  return stored.ok();
}

Result<Done, std::string> FilePreferences::write(std::string_view domain, std::string_view what,
                                                 const Edit& edit, Complaints& complaints) {
  const std::string path = pathOf(domain);
  auto all = read(domain, complaints);
  if (!all) {
    return Failure{"Preference not stored, its file cannot be read: " + path + ", " + std::string(what)};
  }
  if (!edit(all.value())) return Done();
  const auto stored = _files.replace(path, writeBinaryPropertyList(all.value()));
  if (stored) return Done();
  return Failure{"Preference not stored: " + stored.error().description + ", " + std::string(what)};
}

}  // namespace veltrad::platform
