#include "sysaux/copies.h"

#include <unistd.h>

#include <cstdint>
#include <string_view>

namespace sysaux {

namespace {

constexpr long long kKibi = 1024;
constexpr long long kMebi = 1024 * kKibi;

// Bytes that mark a copy. A negative place counts from the end of the device.
struct Mark {
  const char* name;
  long long at;
  std::string_view bytes;
};

// The places in sectors are those of disks with sectors of 512 and of 4096 bytes.
constexpr Mark kMarks[] = {
    {"damaged_vfat", 6 * 512 + 82, "FAT32   "},     {"damaged_vfat", 6 * 4096 + 82, "FAT32   "},
    {"damaged_exfat", 12 * 512 + 3, "EXFAT   "},    {"damaged_exfat", 12 * 4096 + 3, "EXFAT   "},
    {"damaged_btrfs", 64 * kMebi + 64, "_BHRfS_M"}, {"damaged_btrfs", 256 * (kKibi * kMebi) + 64, "_BHRfS_M"},
    {"damaged_hfs", -1024, {"H+\0\4", 4}},          {"damaged_hfs", -1024, {"HX\0\5", 4}},
    {"damaged_ntfs", -512, "\xebR\x90NTFS "},       {"damaged_ntfs", -4096, "\xebR\x90NTFS "},
};

enum class Found { kYes, kNo, kFailed };

// Reads from one place; what lies beyond an end of the device is not there.
Found read_at(int device, long long end, long long at, void* data, size_t size) {
  if (at < 0 || at + static_cast<long long>(size) > end) return Found::kNo;
  return pread(device, data, size, at) == static_cast<ssize_t>(size) ? Found::kYes : Found::kFailed;
}

Found has_mark(int device, long long end, const Mark& mark) {
  char bytes[16];
  const Found found = read_at(device, end, mark.at < 0 ? end + mark.at : mark.at, bytes, mark.bytes.size());
  if (found != Found::kYes) return found;
  return mark.bytes == std::string_view(bytes, mark.bytes.size()) ? Found::kYes : Found::kNo;
}

uint16_t little16(const unsigned char* bytes) {
  return static_cast<uint16_t>(bytes[0] | bytes[1] << 8);
}

// The superblock that begins the second block group of an ext2, ext3 or ext4 with blocks of 1024 bytes
// shifted by `shift`: a group has eight times as many blocks as a block has bytes.
Found has_ext_copy(int device, long long end, int shift) {
  constexpr int kBlockSizeAt = 24, kMagicAt = 56, kGroupAt = 90;
  constexpr uint16_t kMagic = 0xEF53;
  const long long block = kKibi << shift;
  const long long at = (8 * block + (shift == 0 ? 1 : 0)) * block;
  unsigned char super[92];
  const Found found = read_at(device, end, at, super, sizeof super);
  if (found != Found::kYes) return found;
  const bool fits = little16(super + kMagicAt) == kMagic && little16(super + kGroupAt) == 1 &&
                    little16(super + kBlockSizeAt) == shift;
  return fits ? Found::kYes : Found::kNo;
}

// mkfs.xfs divides a device below 4 TiB into four allocation groups, each with a superblock at its start; in
// larger ones a group has 1 TiB.
Found has_xfs_copy(int device, long long end) {
  constexpr long long kBlock = 4096;
  constexpr long long kGroup = kMebi * kMebi;
  const long long quarter = (end / kBlock + 3) / 4 * kBlock;
  return has_mark(device, end, {"damaged_xfs", quarter < kGroup ? quarter : kGroup, {"XFSB\0\0", 6}});
}

// The uberblocks of ZFS: a ring of them in each of four labels, two at either end of the device, marked in
// the byte order of the machine that wrote them. libblkid goes by the names and values beside them
// since 2.41, and takes a label that it cannot read for none.
Found has_uberblock(int device, long long end, int label) {
  constexpr long long kSmallest = 64 * kMebi;
  constexpr long long kLabel = 256 * kKibi, kRingAt = 128 * kKibi, kRing = 128 * kKibi;
  constexpr size_t kStep = kKibi;
  constexpr std::string_view kLittle{"\x0c\xb1\xba\0\0\0\0\0", 8}, kBig{"\0\0\0\0\0\xba\xb1\x0c", 8};
  const long long first = label < 2 ? 0 : end - end % kLabel - 4 * kLabel;
  char ring[kRing];
  if (end < kSmallest) return Found::kNo;
  const Found found = read_at(device, end, first + label * kLabel + kRingAt, ring, sizeof ring);
  if (found != Found::kYes) return found;
  for (size_t at = 0; at < sizeof ring; at += kStep) {
    const std::string_view magic(ring + at, kLittle.size());
    if (magic == kLittle || magic == kBig) return Found::kYes;
  }
  return Found::kNo;
}

}  // namespace

bool find_copy(int device, const char** name) {
  const long long end = lseek(device, 0, SEEK_END);
  bool readable = end >= 0;
  *name = nullptr;
  const auto note = [&](Found found, const char* kind) {
    if (found == Found::kFailed) readable = false;
    if (found == Found::kYes && *name == nullptr) *name = kind;
  };
  for (const Mark& mark : kMarks) note(has_mark(device, end, mark), mark.name);
  for (int shift = 0; shift <= 2; shift++) note(has_ext_copy(device, end, shift), "damaged_ext");
  note(has_xfs_copy(device, end), "damaged_xfs");
  for (int label = 0; label < 4; label++) note(has_uberblock(device, end, label), "damaged_zfs");
  return readable || *name != nullptr;
}

}  // namespace sysaux
