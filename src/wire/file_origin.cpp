// SPDX-License-Identifier: Apache-2.0
// Uses /proc and calls that never leave the kernel: fstat, fstatfs and read could wait for a file server.
#include "wire/file_origin.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>

#include "base/file_descriptor.h"
#include "base/filled_text.h"

namespace veltrad::wire {

namespace {

constexpr std::array<std::string_view, 28> kLocal{
    "bcachefs", "btrfs",     "devtmpfs", "erofs", "exfat", "ext2",  "ext3",   "ext4",  "f2fs", "hfs",
    "hfsplus",  "hugetlbfs", "iso9660",  "jfs",   "minix", "msdos", "nilfs2", "ntfs3", "proc", "ramfs",
    "reiserfs", "rootfs",    "squashfs", "sysfs", "tmpfs", "udf",   "vfat",   "xfs"};
constexpr std::size_t kMostMountInfo = 8u << 20;

// Empty if it cannot be read.
std::string contentOf(const std::string& path) {
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  std::string text;
  char piece[16 << 10];
  while (file.isOpen() && text.size() < kMostMountInfo) {
    const ssize_t count = ::read(file.get(), piece, sizeof piece);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) break;
    text.append(piece, static_cast<std::size_t>(count));
  }
  return text;
}

std::string_view wordAfter(std::string_view text, std::string_view mark) {
  const std::size_t found = text.find(mark);
  if (found == std::string_view::npos) return {};
  text.remove_prefix(found + mark.size());
  text.remove_prefix(std::min(text.find_first_not_of(" \t"), text.size()));
  return text.substr(0, text.find_first_of(" \t\n"));
}

// A mount in no list that can be read is usual below a chroot. Programs and other machines serve files
// without a device, except for those of a disk that root has mounted by FUSE.
FileOrigin unlisted(int descriptor) {
  struct statx facts {};
  if (::statx(descriptor, "", AT_EMPTY_PATH | AT_STATX_DONT_SYNC, STATX_TYPE, &facts) != 0) return {};
  if (facts.stx_dev_major == 0) return {};
  return {FileOrigin::Kind::local, "of a device"};
}

}  // namespace

FileOrigin::Kind kindOfFileSystem(std::string_view type) {
  if (std::find(kLocal.begin(), kLocal.end(), type) != kLocal.end()) return FileOrigin::Kind::local;
  return type == "overlay" ? FileOrigin::Kind::stacked : FileOrigin::Kind::foreign;
}

std::optional<std::string> typeOfMount(std::string_view mountInfo, std::string_view number) {
  if (number.empty()) return std::nullopt;
  while (!mountInfo.empty()) {
    const std::string_view line = mountInfo.substr(0, mountInfo.find('\n'));
    mountInfo.remove_prefix(std::min(line.size() + 1, mountInfo.size()));
    if (!line.starts_with(number) || !line.substr(number.size()).starts_with(' ')) continue;
    const std::string_view type = wordAfter(line, " - ");
    return type.empty() ? std::nullopt : std::optional(std::string(type));
  }
  return std::nullopt;
}

FileOrigin FileOrigin::of(int descriptor, pid_t lender) {
  // The mount of memory files is in no list. Only they have seals.
  if (::fcntl(descriptor, F_GET_SEALS) >= 0) return {Kind::local, "tmpfs"};
  const std::string facts = contentOf(filled("/proc/self/fdinfo/{}", descriptor));
  const std::string_view mount = wordAfter(facts, "mnt_id:");
  if (const auto type = typeOfMount(contentOf("/proc/self/mountinfo"), mount)) {
    return {kindOfFileSystem(*type), *type};
  }
  if (lender <= 0) return unlisted(descriptor);
  // Mount numbers are unique in the kernel, so it does no harm if another process has this number by now.
  const auto type = typeOfMount(contentOf(filled("/proc/{}/mountinfo", lender)), mount);
  if (!type) return unlisted(descriptor);
  const Kind kind = kindOfFileSystem(*type);
  return {kind == Kind::local ? Kind::local : Kind::foreign, *type};
}

bool isNoRegularFile(int descriptor) {
  struct statx facts {};
  if (::statx(descriptor, "", AT_EMPTY_PATH | AT_STATX_DONT_SYNC, STATX_TYPE, &facts) != 0) return false;
  return (facts.stx_mask & STATX_TYPE) != 0 && !S_ISREG(facts.stx_mode);
}

}  // namespace veltrad::wire
