/* The state that the made-up commands and the made-up platform share: targets with LUNs, sessions, disks.
 *
 * It lies in the file /fake/world/state, mapped by everyone who needs it and changed under the lock of
 * /fake/world/lock. A disk's kernel name is given at the login (the lowest letter that is free, as the kernel
 * does it, so names are used again) and taken back at the logout. The stamp of a LUN stands for the data on
 * it: every format gives a new one. */
#ifndef TORTURE_WORLD_H
#define TORTURE_WORLD_H

#include <stdint.h>

enum { TARGETS = 8, LUNS = 8, FIRST_LETTER = 'b', LAST_LETTER = 'z' };
enum content { CONTENT_NONE = 0, CONTENT_EXT4 = 1, CONTENT_TORN = 2 };

#define NAME_BASE "iqn.2026-01.org.example:t"

/* A target lets in who has both. */
enum { HAS_USER = 1, HAS_SECRET = 2, HAS_BOTH = HAS_USER | HAS_SECRET };

struct lun {
  int32_t offered;
  int32_t letter;  /* of the disk's name, 0 without a session */
  int32_t parts;   /* 0 or 1 */
  int32_t content; /* of the partition */
  int32_t stamp;
  int32_t opener; /* process number of the dd or mke2fs that has the node open */
};

struct target {
  int32_t online;
  int32_t record; /* a node record is there */
  int32_t session;
  int32_t secrets;       /* the record's: HAS_USER, HAS_SECRET */
  struct lun luns[LUNS]; /* by LUN number */
};

/* Which call fails: the index-th of its class, or that and all later ones. */
enum fault_class { FAULT_CALL, FAULT_TREE, FAULT_COMMAND, FAULT_MEMORY, FAULT_CLASSES };
enum fault_kind { KIND_FAIL, KIND_KILL, KIND_NOTHING, KIND_MUTE, KIND_LATE };

struct faults {
  int32_t active;
  int32_t class;
  int32_t index; /* from 1; 0: nothing fails */
  int32_t forever;
  int32_t kind;
  int32_t error; /* errno of a failing call */
  int32_t traced;
  int32_t fired;
  int32_t count[FAULT_CLASSES];
};

struct world {
  int32_t stamps;
  int32_t sessions;
  int32_t pace; /* how long the made-up commands take, in percent of what they would take of themselves */
  int32_t allocated;
  struct target targets[TARGETS + 1]; /* from 1 */
  struct faults faults;
};

/* NULL when there is no world (a program outside of a torture). */
struct world* world_map(void);

/* Gives the lock's descriptor for world_unlock. */
int world_lock(void);
void world_unlock(int lock);

/* The LUN behind a node ("/dev/sdb", "/dev/sdb1" or the name alone); NULL when there is no such disk now. */
struct lun* world_disk(struct world* world, const char* node, int* target, int* number, int* partition);

/* One line in /fake/world/log: kind, time, run, text. */
void world_log(const char* kind, const char* format, ...) __attribute__((format(printf, 2, 3)));

/* Counts a call of the class; non-zero when it is to fail. `name` is for the trace. */
int fault_due(enum fault_class class, const char* name, const char* subject);

/* The point where a mount table shows the node; 0 when none does. */
int world_mounted(const char* node, char* where, unsigned size);

#endif
