#include "ktree/start_settings.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/report.h"

namespace ktree {
namespace {

// Returns whether it is loaded; otherwise `reason` says why not.
bool load_file(const std::string& file, Service& service, std::string& reason) {
  const int fd = open(file.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  struct stat info = {};
  if (fd < 0 || fstat(fd, &info) != 0) {
    reason = strerror(errno);
    return false;
  }
  bool loaded = false;
  if (S_ISREG(info.st_mode)) {
    const Service::Reply answer = service.load_document(fd);
    loaded = answer.status == ReplyStatus::kDone;
    reason = answer.body;
  } else {
    reason = "not a regular file";
  }
  close(fd);
  return loaded;
}

// By a link, so that there is a file at every moment; a file system without links gets it renamed.
void keep_damaged(const std::string& file) {
  const std::string kept = file + ".damaged";
  unlink(kept.c_str());
  if (link(file.c_str(), kept.c_str()) != 0 && rename(file.c_str(), kept.c_str()) != 0) {
    platform::report(LOG_WARNING, "ktree: %s: not kept as %s: %s", file.c_str(), kept.c_str(),
                     strerror(errno));
  }
}

}  // namespace

void load_first(const std::vector<std::string>& files, Service& service) {
  bool passed_over = false;
  for (const std::string& file : files) {
    std::string reason;
    if (load_file(file, service, reason)) {
      if (passed_over) platform::report(LOG_WARNING, "ktree: loaded %s instead", file.c_str());
      return;
    }
    const bool is_there = access(file.c_str(), F_OK) == 0;
    platform::report(is_there ? LOG_WARNING : LOG_NOTICE, "ktree: %s: %s", file.c_str(), reason.c_str());
    passed_over = true;
    if (is_there) keep_damaged(file);
  }
}

}  // namespace ktree
