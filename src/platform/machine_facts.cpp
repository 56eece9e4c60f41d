// SPDX-License-Identifier: Apache-2.0
// Facts from the machine's files.
#include "platform/machine_facts.h"

#include <openssl/evp.h>

#include <charconv>

#include "base/text.h"
#include "platform/environment_file.h"
#include "platform/file_store.h"

namespace veltrad::platform {

namespace {

constexpr std::size_t kMostBytes = 1u << 20;
constexpr std::string_view kDeviceIDSalt = "com.florn.veltrad UniqueDeviceID 1\n";

bool isMachineID(std::string_view text) {
  return text.size() == 32 && text.find_first_not_of("0123456789abcdefABCDEF") == std::string_view::npos;
}

// machine-info(5), "CHASSIS".
std::optional<std::string> deviceNameOfChassis(std::string_view chassis) {
  static constexpr std::pair<std::string_view, std::string_view> kNames[] = {
      {"desktop", "Desktop"}, {"laptop", "Laptop"},       {"convertible", "Laptop"}, {"server", "Server"},
      {"tablet", "Tablet"},   {"handset", "Handset"},     {"watch", "Watch"},        {"embedded", "Embedded"},
      {"vm", "VM"},           {"container", "Container"},
  };
  for (const auto& [word, name] : kNames) {
    if (word == chassis) return std::string(name);
  }
  return std::nullopt;
}

}  // namespace

std::optional<std::string> deviceNameOfChassisType(int type) {
  static constexpr std::pair<int, const char*> kNames[] = {
      {3, "Desktop"},  {4, "Desktop"},   {6, "Desktop"},   {7, "Desktop"},  {8, "Laptop"},   {9, "Laptop"},
      {10, "Laptop"},  {11, "Handset"},  {13, "Desktop"},  {14, "Laptop"},  {17, "Server"},  {23, "Server"},
      {24, "Desktop"}, {25, "Server"},   {28, "Server"},   {29, "Server"},  {30, "Tablet"},  {31, "Laptop"},
      {32, "Laptop"},  {33, "Embedded"}, {34, "Embedded"}, {35, "Desktop"}, {36, "Desktop"},
  };
  for (const auto& [number, name] : kNames) {
    if (number == (type & 0x7f)) return name;  // the highest bit says whether there is a lock
  }
  return std::nullopt;
}

std::optional<std::string> MachineFacts::contents(const char* path) {
  const auto bytes = _files.read(path, kMostBytes);
  if (!bytes) {
    if (bytes.error().passes() && !_shortage) _shortage = bytes.error();
    return std::nullopt;
  }
  const std::string_view text = trimmed(bytes.value(), {" \t\r\n\0", 5});
  return text.empty() ? std::nullopt : std::optional(toUTF8(text));
}

std::optional<std::string> MachineFacts::fromOSRelease(const char* name) {
  for (const char* path : {"/etc/os-release", "/usr/lib/os-release"}) {
    if (const auto text = contents(path)) return valueInEnvironmentFile(*text, name);
  }
  return std::nullopt;
}

std::optional<std::string> MachineFacts::buildVersion() {
  if (auto build = fromOSRelease("BUILD_ID")) return build;
  return contents("/proc/sys/kernel/osrelease");
}

std::optional<std::string> MachineFacts::productType() {
  if (auto name = contents("/sys/class/dmi/id/product_name")) return name;
  return contents("/proc/device-tree/model");
}

std::optional<std::string> MachineFacts::uniqueDeviceID() {
  const auto machineID = contents("/etc/machine-id");
  if (!machineID || !isMachineID(*machineID)) return std::nullopt;
  const std::string salted = std::string(kDeviceIDSalt) + *machineID;
  unsigned char digest[EVP_MAX_MD_SIZE];
  if (EVP_Digest(salted.data(), salted.size(), digest, nullptr, EVP_sha256(), nullptr) != 1)
    return std::nullopt;
  return hex({reinterpret_cast<const char*>(digest), 20});
}

// Does not open the file, which the sandbox would not allow.
bool MachineFacts::exists(const char* path) {
  const auto stamp = _files.stamp(path);
  if (!stamp && !_shortage) _shortage = stamp.error();
  return stamp && stamp.value();
}

bool MachineFacts::isContainer() {
  return exists("/run/systemd/container") || exists("/run/.containerenv") || exists("/.dockerenv");
}

bool MachineFacts::isVirtualMachine() {
  for (const char* path : {"/sys/class/dmi/id/sys_vendor", "/sys/class/dmi/id/product_name"}) {
    const auto text = contents(path);
    if (!text) continue;
    for (const char* sign : {"QEMU", "KVM", "VMware", "VirtualBox", "innotek", "Xen", "Bochs",
                             "Virtual Machine", "Amazon EC2", "Google Compute Engine", "Parallels"}) {
      if (containsIgnoringCase(*text, sign)) return true;
    }
  }
  const auto processors = contents("/proc/cpuinfo");
  if (!processors) return false;
  const auto flags = processors->find("\nflags");
  if (flags == std::string::npos) return false;
  const std::string line = processors->substr(flags + 1, processors->find('\n', flags + 1) - flags - 1) + " ";
  return line.find(" hypervisor ") != std::string::npos;
}

std::string MachineFacts::deviceName() {
  if (const auto information = contents("/etc/machine-info")) {
    const auto chassis = valueInEnvironmentFile(*information, "CHASSIS");
    if (const auto name = chassis ? deviceNameOfChassis(*chassis) : std::nullopt) return *name;
  }
  if (isContainer()) return "Container";
  if (isVirtualMachine()) return "VM";
  if (const auto text = contents("/sys/class/dmi/id/chassis_type")) {
    int type = 0;
    std::from_chars(text->data(), text->data() + text->size(), type);
    if (const auto name = deviceNameOfChassisType(type)) return *name;
  }
  return exists("/proc/device-tree/model") ? "Embedded" : "Computer";
}

}  // namespace veltrad::platform
