// SPDX-License-Identifier: Apache-2.0
// Facts about the machine from os-release, DMI, the device tree and the machine id.
#pragma once

#include <optional>
#include <string>

#include "platform/file_store.h"

namespace veltrad::platform {

// Each function reads the host's files again; absent if the machine does not state the fact. To be made for
// one question: after a shortage, the result is not reliable.
class MachineFacts {
 public:
  explicit MachineFacts(FileStore& files) : _files(files) {}

  // The first file that could not be read because of a shortage.
  const std::optional<FileFailure>& shortage() const { return _shortage; }

  std::optional<std::string> productVersion() { return fromOSRelease("VERSION_ID"); }
  // BUILD_ID, else the kernel's release.
  std::optional<std::string> buildVersion();
  // DMI's product name, else the device tree's model.
  std::optional<std::string> productType();
  // "Desktop", "Laptop", "Server", "Tablet", "Handset", "Embedded", "Watch", "VM", "Container" or, if nothing
  // is known, "Computer".
  std::string deviceName();
  std::optional<std::string> hardwareModel() { return contents("/sys/class/dmi/id/board_name"); }
  // Readable only by root.
  std::optional<std::string> serialNumber() { return contents("/sys/class/dmi/id/product_serial"); }
  // The first 40 hexadecimal digits of SHA-256 over a salt and the machine id, so that the id cannot be
  // derived from it.
  std::optional<std::string> uniqueDeviceID();

 private:
  // Without blanks and NULs at either end; absent if empty.
  std::optional<std::string> contents(const char* path);
  std::optional<std::string> fromOSRelease(const char* name);
  bool exists(const char* path);
  bool isContainer();
  bool isVirtualMachine();

  FileStore& _files;
  std::optional<FileFailure> _shortage;
};

// The name for an SMBIOS chassis type; absent for types that say nothing.
std::optional<std::string> deviceNameOfChassisType(int type);

}  // namespace veltrad::platform
