/* Calls one function of the platform libraries and prints what it gives, for tests on real devices: the
 * result, then what it put out. Written in C, because the headers promise to be usable from C. */
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "ktreec.h"
#include "ostel_common.h"
#include "sysaux.h"

static int fs_type(const char* node) {
  char name[16];
  memset(name, 'x', sizeof name);
  const int result = sys_get_fs_type(name, node);
  return printf("%d %s\n", result, name);
}

static int partition_list(const char* device) {
  /* The guard behind the buffer shows a write past its end. */
  struct {
    char list[1024];
    char guard[64];
  } out;
  memset(&out, 'x', sizeof out);
  const int result = sys_get_partition_list(out.list, device);
  for (size_t i = 0; i < sizeof out.guard; i++) {
    if (out.guard[i] != 'x') abort();
  }
  return printf("%d %s\n", result, out.list);
}

static int df_info(const char* path) {
  unsigned long long total = 0, used = 0, available = 0;
  const int result = sys_get_df_info(path, &total, &used, &available);
  return printf("%d %llu %llu %llu\n", result, total, used, available);
}

static int mac_addr(const char* interface) {
  unsigned char mac[6] = {0};
  const int result = sys_get_mac_addr(interface, mac);
  return printf("%d %02x:%02x:%02x:%02x:%02x:%02x\n", result, mac[0], mac[1], mac[2], mac[3], mac[4], mac[5]);
}

static int host_name(const char* size) {
  char name[256] = "";
  const int result = sys_hostname(name, (size_t)atoi(size));
  return printf("%d %s\n", result, name);
}

static int disk_space(const char* device) {
  return printf("%lld\n", sys_get_disk_space("%s", device));
}
static int partition_size(const char* name) {
  return printf("%lld\n", sys_get_partition_size(name));
}
static int create(const char* device) {
  return printf("%d\n", sys_create_1_partition(device));
}
static int expand(const char* device) {
  return printf("%d\n", sys_expand_1_partition(device));
}
static int check_dev(const char* node) {
  return printf("%d\n", sys_check_dev(node));
}
static int check_fs_state(const char* node) {
  return printf("%d\n", sys_check_fs_state(node));
}
static int mount_point(const char* path) {
  return printf("%d\n", sys_mount_point(path));
}
static int link_speed(const char* port) {
  return printf("%d\n", LIB_Get_Lan_Link_Speed(atoi(port)));
}

static const struct {
  const char* name;
  int (*call)(const char* argument);
} calls[] = {
    {"check_dev", check_dev},
    {"check_fs_state", check_fs_state},
    {"create", create},
    {"df_info", df_info},
    {"disk_space", disk_space},
    {"expand", expand},
    {"fs_type", fs_type},
    {"hostname", host_name},
    {"link_speed", link_speed},
    {"mac_addr", mac_addr},
    {"mount_point", mount_point},
    {"partition_list", partition_list},
    {"partition_size", partition_size},
};

int main(int argc, char** argv) {
  for (size_t i = 0; argc == 3 && i < sizeof calls / sizeof calls[0]; i++) {
    if (strcmp(argv[1], calls[i].name) == 0) return calls[i].call(argv[2]) < 0;
  }
  fprintf(stderr, "usage: %s CALL ARGUMENT\n", argv[0]);
  return 2;
}
