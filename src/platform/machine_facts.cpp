// The machine's own files, read at each question. Any thread.
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
  switch (type & 0x7f) {  // the highest bit tells of a lock
    case 3:
    case 4:
    case 6:
    case 7:
    case 13:
    case 24:
    case 35:
    case 36:
      return "Desktop";
    case 8:
    case 9:
    case 10:
    case 14:
    case 31:
    case 32:
      return "Laptop";
    case 11:
      return "Handset";
    case 17:
    case 23:
    case 25:
    case 28:
    case 29:
      return "Server";
    case 30:
      return "Tablet";
    case 33:
    case 34:
      return "Embedded";
    default:
      return std::nullopt;
  }
}

std::optional<std::string> MachineFacts::contents(const char* path) {
  const auto bytes = _files.read(path, kMostBytes);
  if (!bytes) {
    if (bytes.error().passes() && !_shortage) _shortage = bytes.error();
    return std::nullopt;
  }
  static constexpr std::string_view kBlanks(" \t\r\n\0", 5);
  const std::string& text = bytes.value();
  const auto begin = text.find_first_not_of(kBlanks);
  if (begin == std::string::npos) return std::nullopt;
  return toUTF8(std::string_view(text).substr(begin, text.find_last_not_of(kBlanks) - begin + 1));
}

std::optional<std::string> MachineFacts::fromOSRelease(const char* name) {
  for (const char* path : {"/etc/os-release", "/usr/lib/os-release"}) {
    if (const auto text = contents(path)) return valueInEnvironmentFile(*text, name);
  }
  return std::nullopt;
}

std::optional<std::string> MachineFacts::productVersion() {
  return fromOSRelease("VERSION_ID");
}

std::optional<std::string> MachineFacts::buildVersion() {
  if (auto build = fromOSRelease("BUILD_ID")) return build;
  return contents("/proc/sys/kernel/osrelease");
}

std::optional<std::string> MachineFacts::productType() {
  if (auto name = contents("/sys/class/dmi/id/product_name")) return name;
  return contents("/proc/device-tree/model");
}

std::optional<std::string> MachineFacts::hardwareModel() {
  return contents("/sys/class/dmi/id/board_name");
}

std::optional<std::string> MachineFacts::serialNumber() {
  return contents("/sys/class/dmi/id/product_serial");
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

// Existence is asked alone: the sandbox lets nobody open what this is asked of.
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
