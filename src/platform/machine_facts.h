// What the machine says of itself: os-release, DMI, device tree, machine id. Any thread; nothing is cached.
#pragma once

#include <optional>
#include <string>

namespace veltrad::platform {

class FileStore;

// Each reads the host's own files afresh through `files`; nothing where the machine does not say.
class MachineFacts {
 public:
  explicit MachineFacts(FileStore& files) : _files(files) {}

  std::optional<std::string> productVersion() const;  // VERSION_ID
  std::optional<std::string> buildVersion() const;    // BUILD_ID, else the kernel's release
  std::optional<std::string> productType() const;     // DMI's product name, else the device tree's model
  // "Desktop", "Laptop", "Server", "Tablet", "Handset", "Embedded", "Watch", "VM", "Container"; never
  // nothing: "Computer" where nothing is known.
  std::string deviceName() const;
  std::optional<std::string> hardwareModel() const;  // DMI's board name
  std::optional<std::string> serialNumber() const;   // DMI's product serial, which only root may read
  // The first 40 hexadecimal digits of SHA-256 over a text of our own and the machine id: the id cannot be
  // told from it, and no other program derives the same.
  std::optional<std::string> uniqueDeviceID() const;

 private:
  // Without blanks and NULs at either end; nothing when that leaves nothing.
  std::optional<std::string> contents(const char* path) const;
  std::optional<std::string> fromOSRelease(const char* name) const;
  bool isContainer() const;
  bool isVirtualMachine() const;

  FileStore& _files;
};

// By SMBIOS chassis type, as the firmware numbers them; nothing for types that tell
// nothing.
std::optional<std::string> deviceNameOfChassisType(int type);

}  // namespace veltrad::platform
