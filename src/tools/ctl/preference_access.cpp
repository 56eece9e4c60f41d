// SPDX-License-Identifier: Apache-2.0
// Asks the daemon, or accesses the files if no daemon runs.
#include "tools/ctl/preference_access.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <cerrno>
#include <string_view>

#include "config/preference_editor.h"
#include "platform/daemon_lock.h"
#include "platform/device_properties.h"
#include "platform/file_store.h"
#include "platform/preferences.h"
#include "platform/root.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace question = wire::question;
using platform::Ownership;

struct PreferenceAccess::Files {
  explicit Files(const platform::Root& root)
      : preferences(store, root.preferencesDirectory()), device(store, root.devicePath()) {}

  platform::DiskFileStore store{Ownership::inherited};
  platform::FilePreferences preferences;
  platform::MachineProperties device;
  config::PreferenceEditor editor{preferences, device};
  FileDescriptor lock;
};

namespace {

bool isMissing(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) != 0 && (errno == ENOENT || errno == ENOTDIR);
}

// `why`: of the control socket that did not answer.
Result<FileDescriptor, std::string> takeLock(const platform::Root& root, const std::string& why) {
  const std::string path = root.lockPath();
  if (const auto made = platform::makeDirectories(root.runDirectory(), 0755, Ownership::inherited); !made) {
    return Failure{
        fmt::format("No daemon answers, and none can be kept from starting: {}. Run veltractl as "
                    "root or as the user that runs veltrad.",
                    made.error().description)};
  }
  auto lock = platform::takeDaemonLock(path, Ownership::inherited);
  if (!lock && lock.error().held)
    return Failure{fmt::format("A daemon runs, but does not answer ({}): {}", lock.error().description, why)};
  if (!lock) {
    return Failure{fmt::format(
        "No daemon answers, and whether one runs cannot be told: {}. Run veltractl as root or as the user "
        "that runs veltrad.",
        lock.error().description)};
  }
  return std::move(lock.value());
}

}  // namespace

PreferenceAccess::PreferenceAccess() = default;
PreferenceAccess::PreferenceAccess(PreferenceAccess&&) noexcept = default;
PreferenceAccess::~PreferenceAccess() = default;

Result<PreferenceAccess, std::string> PreferenceAccess::open(const std::optional<std::string>& where,
                                                             Use use) {
  PreferenceAccess access;
  auto daemon = ControlClient::connect(where);
  if (daemon) {
    access._daemon.emplace(std::move(daemon.value()));
    return access;
  }
  const auto root = where ? platform::Root(*where) : platform::Root::fromEnvironment();
  access._files = std::make_unique<Files>(root);
  // If no daemon has ever run, there is no lock to take, and reading creates no file.
  if (use == Use::read && isMissing(root.lockPath())) return access;
  auto lock = takeLock(root, daemon.error());
  if (!lock) return Failure{lock.error()};
  access._files->lock = std::move(lock.value());
  if (use == Use::read) return access;
  const auto made = platform::makeDirectories(root.preferencesDirectory(), 0755, Ownership::inherited);
  if (!made) return Failure{made.error().description};
  return access;
}

Result<Dictionary, std::string> PreferenceAccess::ask(const char* name, const Dictionary& arguments) {
  if (_daemon) return _daemon->ask(name, arguments);
  config::PreferenceEditor& editor = _files->editor;
  if (std::string_view(name) == question::kSetConfig) return editor.set(arguments);
  if (std::string_view(name) == question::kUnsetConfig) return editor.unset(arguments);
  return editor.list();
}

}  // namespace veltrad::ctl
