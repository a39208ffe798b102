/* System utilities of the appliance's platform. Usable from C and C++. Sizes are in bytes. */
#ifndef SYSAUX_H
#define SYSAUX_H

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* Runs the shell command that printf(format, ...) would print. Returns what system(3) returns, or -1 when the
 * command cannot be formatted. */
int System(const char* format, ...) __attribute__((format(printf, 1, 2)));

/* Copies `text` into `out` of `size` bytes and puts a backslash before each character that a shell interprets
 * inside double quotes. Returns 0; -1 when `out` is too small, `out` is then empty. */
int str_insert_back_slash(char* out, size_t size, const char* text);

/* Removes the characters of `set` from both ends of `text`, in place. Returns `text`. */
char* strtrim(char* text, const char* set);

/* Removes the characters of `set` from the right end of `text`, in place. Returns `text`. */
char* strrtrim(char* text, const char* set);

/* Converts decimal text to a number; leading blanks are allowed, and what follows the digits is ignored.
 * Returns 0 when it does not begin with a number, the nearest possible number when it is too large. */
long long str2ll(const char* text);

/* Reads the hardware address of a network interface. Returns 0, or -1 when there is no such interface or it
 * has no Ethernet address. */
int sys_get_mac_addr(const char* interface, unsigned char mac[6]);

/* Puts the host name into `out` of `size` bytes. Returns 0, or -1 when it is empty or does not fit. */
int sys_hostname(char* out, size_t size);

/* Returns the size of the block device whose path printf(format, ...) would print; 0 or less when unknown. A
 * node missing in /dev is looked for in /sys/class/block, here and in sys_get_partition_list. */
long long sys_get_disk_space(const char* format, ...) __attribute__((format(printf, 1, 2)));

/* Writes the kernel names of the partitions of `device` (a path), joined by ",", into `out`, which holds at
 * least 1024 characters; names that do not fit are left out. Returns their number; -1 when `device` is no
 * block device, cannot be read, or has a GPT of which only the protective MBR can be used. Where the kernel
 * has not read the partition table, it is told of the partitions; they count also when it refuses them, so 0
 * means that there is no partition on the disk, or none that the kernel knows when the node is missing. */
int sys_get_partition_list(char* out, const char* device);

/* Writes a new partition table (GPT) with one aligned partition of the type "Linux filesystem" that covers
 * the disk. Returns when the partition's node is in /dev, or after 5 seconds. It refuses a disk in use,
 * one with partitions, one that carries a file system, LVM, RAID, encryption or another signature of its
 * own, one on which only copies of a file system's lost first sectors are left, and one that cannot be
 * read. What lies in the new partition's place stays as it is. Returns 0, or non-zero. */
int sys_create_1_partition(const char* device);

/* Grows the only partition of `device` (in a GPT, or a primary one in a DOS table, which ends at 2 TiB) to
 * the end of the disk and keeps its data; it may be mounted. Returns 0 when the kernel shows the new size, or
 * non-zero. */
int sys_expand_1_partition(const char* device);

/* Returns the size of a partition by its kernel name, such as sdb1; 0 or less when unknown. */
long long sys_get_partition_size(const char* name);

/* Returns 0 when `node` is a block device whose first mebibyte can be read in full, non-zero otherwise. */
int sys_check_dev(const char* node);

/* Puts the name of the file system on `node` into `out`, which holds at least 16 characters: ext2, ext3,
 * ext4, vfat, ntfs, hfsplus, xfs, or what libblkid(3) calls it. Another signature (LVM, RAID, encryption,
 * swap, a partition table ...) counts and gives its name, cut to 15 characters; several that contradict each
 * other give "ambivalent", copies of a file system's lost first sectors "damaged_" and its kind, a device
 * that reads at its start and fails further on "unreadable": none of them is empty. Returns 0; 1 when all
 * places were examined and nothing was recognised; -1 when `node` is no block device or cannot be read, so
 * that nothing is known of it. `out` is the empty text in both. */
int sys_get_fs_type(char* out, const char* node);

/* Returns non-zero when the ext2, ext3 or ext4 file system on `node` says of itself that it wants a check:
 * not cleanly unmounted, errors, a journal to replay, or a damaged superblock. Others, and none, give 0. */
int sys_check_fs_state(const char* node);

/* Returns non-zero when `path` (links are followed) is a mount point. Nothing is read from the volume. */
int sys_mount_point(const char* path);

/* Gives the size, the used and the available bytes of the file system mounted on `path`. Returns 0, or -1
 * when `path` is not a mount point. */
int sys_get_df_info(const char* path, unsigned long long* total, unsigned long long* used,
                    unsigned long long* available);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
