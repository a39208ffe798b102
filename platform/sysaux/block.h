// What the kernel tells about a block device: its directory in sysfs, without opening the device itself, so
// that a disk whose connection is lost holds nobody up.
//
// Source: https://docs.kernel.org/admin-guide/sysfs-rules.html; sizes and starts are in units of 512 bytes
// whatever the sector size of the disk is.
#ifndef PLATFORM_SYSAUX_BLOCK_H
#define PLATFORM_SYSAUX_BLOCK_H

#include <cstddef>

namespace sysaux {

constexpr long long kSectorBytes = 512;
constexpr size_t kFirstMebibyte = 1 << 20;

// Opens the sysfs directory of the block device that `node` (a path, links are followed) is. A node missing
// in /dev is looked for by its name. Returns a descriptor, or -1 when it is no block device or the kernel has
// no such device.
int open_block_dir(const char* node);

// Writes the kernel name of the block device `node` into `name` of `size` bytes. Returns false when there is
// none or it does not fit.
bool kernel_name(const char* node, char* name, size_t size);

// Reads the first line of the file `name` in the directory `dir`, without its newline, into `text` of `size`
// bytes. Returns false when it cannot be read.
bool read_line_at(int dir, const char* name, char* text, size_t size);

// Reads the decimal number in the file `name` in the directory `dir`. Returns false when there is none.
bool read_number_at(int dir, const char* name, long long* value);

// Reads the first mebibyte of the open device from the device itself, whatever was read of it before. Returns
// true when all of it came; a device that is smaller gives false.
bool first_mebibyte_readable(int fd);

}  // namespace sysaux

#endif
