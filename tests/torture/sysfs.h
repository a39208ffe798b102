/* What the kernel shows of a disk: its nodes in /dev, and /sys as far as anybody asks. */
#ifndef TORTURE_SYSFS_H
#define TORTURE_SYSFS_H

#include "world.h"

enum { DISK_MAJOR = 250 }; /* one that no driver has */

/* Of the disk with this letter; its partition has the next. */
#define DISK_NUMBER(letter) ((unsigned)((letter) - 'a') * 16)

void sysfs_add(int target, int number, const struct lun* lun, int session);

/* A partition was made on the disk. */
void sysfs_add_partition(const struct lun* lun);

void sysfs_remove(const struct lun* lun);
void sysfs_remove_session(int session);

#endif
