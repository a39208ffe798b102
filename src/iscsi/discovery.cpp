#include "iscsi/discovery.h"

#include <cstdio>
#include <cstring>

#include "frontend/log.h"
#include "iscsi/discovered_names.h"
#include "iscsi/iface.h"
#include "iscsi/iscsiadm.h"
#include "iscsi/result_daemon.h"
#include "iscsi/session_check.h"
#include "iscsi/session_listing.h"
#include "ktreec.h"
#include "support/command.h"
#include "support/files.h"
#include "support/program.h"
#include "support/result.h"
#include "support/temp_file.h"
#include "support/text.h"
#include "tree/access.h"
#include "tree_layout.h"

namespace remvol {

namespace {

// The name is also that of the listing which ktree_update_dev reads: each use writes it anew.
PathText discovery_path() {
  return PathText("/tmp/%s.tmp", program_name());
}

// Asks the portal for its targets. Returns whether the command succeeded.
bool discover(const char* address, int port, const char* iface, const char* path) {
  return run_command(discovery_command(address, port, iface, path)) == 0;
}

// Reads the names that lines of the requested address show, in ascending order. The same name stays as often
// as it is offered. Returns false when memory is too short for them.
bool read_names(FILE* file, const char* address, DiscoveredNames* names) {
  DiscoveredName last = {};
  char line[kListingLineSize];
  for (int lines = 0; fgets(line, sizeof line, file) != nullptr;) {
    if (!is_discovery_line_of(line, address)) continue;
    lines++;
    if (read_discovered_name(line, last.text) && !names->add(last)) {
      LOG(0, "out of memory for the names that %s offers", address);
      return false;
    }
    LOG(3, "line %d: %s", lines, last.text);
  }
  names->sort();
  LOG(kNote, "vector size: %ld", static_cast<long>(names->size()));
  return true;
}

// Replaces the stored names. A failed write leaves its place empty.
void publish_names(const char* socket, const DiscoveredNames& names) {
  if (ktreec_del(socket, 0, key::kSearch) != 0) {
    LOG(0, "ktreec_del() failed, path: '%s'", key::kSearch);
  }
  int i = 0;
  for (const DiscoveredName& name : names) {
    LOG(3, "vector(%d): %s", i, name.text);
    i++;
    (void)tree_write_once_to(socket, KeyText(key::kSearchName, i), name.text);
  }
}

// The search itself. Returns the result of task_search.
int search_portal(const TargetEntry& request, const char* socket) {
  const TempFile path(discovery_path());
  LOG(kNote, "ip: %s, port: %d", request.ip, request.port);
  int result = discover(request.ip, request.port, request.iface, path) ? kSearched : kSearchFailed;
  File file(fopen(path, "re"));
  if (file == nullptr) return kSearchUnread;
  DiscoveredNames names;
  if (!read_names(file.get(), request.ip, &names)) return kSearchFailed;
  publish_names(socket, names);
  file.reset();
  if (tree_write_once_to(socket, key::kSearchDone, "1") != kOk) result = kSearchFailed;
  return result;
}

// Returns whether the arguments name a target and a portal; logs what is wrong.
bool check_portal_arguments(const char* name, const char* address, int port) {
  if (name == nullptr || address == nullptr) {
    LOG(0, "target name or ip is not given");
  } else if (name[0] == '\0' || address[0] == '\0') {
    LOG(0, "target_name or ip is not valid");
  } else if (port < 1 || port > 65535) {
    LOG(0, "Port is not valid");
  } else {
    return true;
  }
  return false;
}

int not_offered(const char* name, const char* address, int port) {
  LOG(2, "Can not find %s at IP: %s Port: %d", name, address, port);
  return kNotOffered;
}

bool find_offer(FILE* file, const char* name, const char* address, int port) {
  char line[kListingLineSize];
  while (fgets(line, sizeof line, file) != nullptr) {
    if (!discovery_line_offers(line, name, address, port)) continue;
    LOG(2, "get target at %s", line);
    return true;
  }
  return false;
}

}  // namespace

int task_search(const TargetEntry& request, const char* output_file) {
  const LogScope scope;
  LOG(2, "start");
  // Without an interface no private daemon is started, and what is dumped at the end is the default tree.
  const char* socket = nullptr;
  int result = kSearchFailed;
  TargetEntry portal = request;
  if (get_iface_name(&portal) == 0) {
    socket = open_results(kTargetResults, output_file);
    result = search_portal(portal, socket);
  }
  LOG(2, "end, ret = %d", result);
  close_results(kTargetResults, socket, output_file);
  return result;
}

int Portal_search_target(const char* name, const char* address, int port) {
  const LogScope scope;
  if (!check_portal_arguments(name, address, port)) return kFailed;
  if (check_target_connected(name) != kNotLoggedIn) {
    LOG(1, "%s is connecting.", name);
    return kLoggedInAlready;
  }
  char iface[16];
  if (_get_iface_name(iface, sizeof iface, address) != 0) return kFailed;
  LOG(2, "ip: %s, port: %d", address, port);
  const TempFile path(discovery_path());
  if (!discover(address, port, iface, path)) return not_offered(name, address, port);
  File file(fopen(path, "re"));
  if (file == nullptr) {
    LOG(1, "discovery target failed at IP: %s Port: %d", address, port);
    return kNotOffered;
  }
  const bool offered = find_offer(file.get(), name, address, port);
  file.reset();
  (void)_remove_file(path);
  return offered ? kOffered : not_offered(name, address, port);
}

}  // namespace remvol
