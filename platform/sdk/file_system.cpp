#include "platform/sdk/file_system.h"

#include "kovaplatform/kovasdk.h"

#include <algorithm>
#include <iterator>

namespace KovaPlatform {
namespace {

struct Row {
  std::string_view name;
  FileSystem kind;
};

// What may hold a volume is listed, not what may not: an unknown file system is left out until
// it is known to work. NTFS has three drivers, and the one in user space shows as fuseblk.
constexpr Row kRows[] = {
    {"ext2", {KOVA_VOL_FS_EXT, true}},     {"ext3", {KOVA_VOL_FS_EXT, true}},
    {"ext4", {KOVA_VOL_FS_EXT4, true}},    {"btrfs", {KOVA_VOL_FS_BTRFS, true}},
    {"xfs", {KOVA_VOL_FS_XFS, true}},      {"f2fs", {KOVA_VOL_FS_F2FS, true}},
    {"zfs", {KOVA_VOL_FS_ZFS, true}},      {"ntfs", {KOVA_VOL_FS_NTFS, false}},
    {"ntfs3", {KOVA_VOL_FS_NTFS, false}},  {"fuseblk", {KOVA_VOL_FS_NTFS, false}},
    {"exfat", {KOVA_VOL_FS_EXFAT, false}}, {"vfat", {KOVA_VOL_FS_VFAT, false}},
};

// A user-space file system on a block device may show its own name after this prefix.
std::string_view withoutHelper(std::string_view name) {
  constexpr std::string_view kPrefix = "fuseblk.";
  return name.substr(0, kPrefix.size()) == kPrefix ? name.substr(kPrefix.size()) : name;
}

} // namespace

const FileSystem *findFileSystem(std::string_view name) {
  const std::string_view plain = withoutHelper(name);
  const auto *row = std::find_if(std::begin(kRows), std::end(kRows),
                                 [&](const Row &candidate) { return candidate.name == plain; });
  return row == std::end(kRows) ? nullptr : &row->kind;
}

std::int32_t fileSystemCode(std::string_view name) {
  const FileSystem *kind = findFileSystem(name);
  return kind == nullptr ? KOVA_VOL_FS_OTHER : kind->code;
}

// By code, because that is what a volume has; the configuration may have set it. A code without a
// row is taken for a file system that keeps modes, so that a mode that cannot be set is an error
// there.
bool keepsModes(std::int32_t code) {
  return std::none_of(std::begin(kRows), std::end(kRows), [&](const Row &row) {
    return row.kind.code == code && !row.kind.keepsModes;
  });
}

} // namespace KovaPlatform
