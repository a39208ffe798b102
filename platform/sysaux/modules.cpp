#include "sysaux/modules.h"

#include <dlfcn.h>
#include <sys/stat.h>

#include <climits>
#include <cstdio>
#include <cstring>

#include "sysaux.h"

namespace {

// Loads the module `file` that lies beside this library; null when it cannot be had. Its whole path is given,
// and the search not left to this library's RUNPATH, because a sanitizer's own dlopen loses whose RUNPATH
// counts.
void* load_module(const char* file) {
  Dl_info self;
  char path[PATH_MAX];
  if (dladdr(reinterpret_cast<void*>(&load_module), &self) == 0) return nullptr;
  const char* slash = strrchr(self.dli_fname, '/');
  const int folder = slash != nullptr ? static_cast<int>(slash - self.dli_fname) + 1 : 0;
  const int length = snprintf(path, sizeof path, "%.*s%s", folder, self.dli_fname, file);
  if (length < 0 || static_cast<size_t>(length) >= sizeof path) return nullptr;
  return dlopen(path, RTLD_LAZY | RTLD_LOCAL);
}

// A module and its handle. Two threads that load it at once get the same handle from dlopen, so the loser's
// store changes nothing.
struct Module {
  const char* file;
  void* handle;
};

Module probe_module{"libsysaux_probe.so", nullptr};
Module disk_module{"libsysaux_disk.so", nullptr};
Module state_module{"libsysaux_state.so", nullptr};

template <typename Function>
Function* find(Module& module, const char* symbol) {
  void* handle = __atomic_load_n(&module.handle, __ATOMIC_ACQUIRE);
  if (handle == nullptr) {
    handle = load_module(module.file);
    if (handle == nullptr) return nullptr;
    __atomic_store_n(&module.handle, handle, __ATOMIC_RELEASE);
  }
  return reinterpret_cast<Function*>(dlsym(handle, symbol));
}

bool is_block_device(const char* node) {
  struct stat info;
  return node != nullptr && stat(node, &info) == 0 && S_ISBLK(info.st_mode);
}

}  // namespace

extern "C" {

// That there is no disk to look at is found out without the module and its libraries.
int sys_get_fs_type(char* out, const char* node) {
  out[0] = '\0';
  if (!is_block_device(node)) return -1;
  const auto call = find<decltype(sysaux_probe_fs_type)>(probe_module, "sysaux_probe_fs_type");
  return call != nullptr ? call(out, node) : -1;
}

int sys_get_partition_list(char* out, const char* device) {
  const auto call = find<decltype(sysaux_probe_partition_list)>(probe_module, "sysaux_probe_partition_list");
  if (call != nullptr) return call(out, device);
  out[0] = '\0';
  return -1;
}

int sys_create_1_partition(const char* device) {
  const auto call =
      find<decltype(sysaux_disk_create_1_partition)>(disk_module, "sysaux_disk_create_1_partition");
  return call != nullptr ? call(device) : -1;
}

int sys_expand_1_partition(const char* device) {
  const auto call =
      find<decltype(sysaux_disk_expand_1_partition)>(disk_module, "sysaux_disk_expand_1_partition");
  return call != nullptr ? call(device) : -1;
}

int sys_check_fs_state(const char* node) {
  const auto call = find<decltype(sysaux_state_check_fs_state)>(state_module, "sysaux_state_check_fs_state");
  return call != nullptr ? call(node) : 0;
}

}  // extern "C"
