// What the machine says of itself: os-release, DMI, device tree, machine id. One thread; made for a question.
#pragma once

#include <optional>
#include <string>

#include "platform/file_store.h"

namespace veltrad::platform {

// Each reads the host's own files afresh through `files`; nothing where the machine does not say. What was
// answered while `shortage()` tells of one is no answer.
class MachineFacts {
 public:
  explicit MachineFacts(FileStore& files) : _files(files) {}

  // The first file that could not be looked at just now.
  const std::optional<FileFailure>& shortage() const { return _shortage; }

  std::optional<std::string> productVersion();  // VERSION_ID
  std::optional<std::string> buildVersion();    // BUILD_ID, else the kernel's release
  std::optional<std::string> productType();     // DMI's product name, else the device tree's model
  // "Desktop", "Laptop", "Server", "Tablet", "Handset", "Embedded", "Watch", "VM", "Container"; never
  // nothing: "Computer" where nothing is known.
  std::string deviceName();
  std::optional<std::string> hardwareModel();  // DMI's board name
  std::optional<std::string> serialNumber();   // DMI's product serial, which only root may read
  // The first 40 hexadecimal digits of SHA-256 over a text of our own and the machine id: the id cannot be
  // told from it, and no other program derives the same.
  std::optional<std::string> uniqueDeviceID();

 private:
  // Without blanks and NULs at either end; nothing when that leaves nothing.
  std::optional<std::string> contents(const char* path);
  std::optional<std::string> fromOSRelease(const char* name);
  bool exists(const char* path);
  bool isContainer();
  bool isVirtualMachine();

  FileStore& _files;
  std::optional<FileFailure> _shortage;
};

// By SMBIOS chassis type, as the firmware numbers them; nothing for types that tell
// nothing.
std::optional<std::string> deviceNameOfChassisType(int type);

}  // namespace veltrad::platform
