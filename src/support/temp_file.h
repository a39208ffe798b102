// Temporary files with fixed names, into which commands write.
#ifndef REMVOL_SUPPORT_TEMP_FILE_H
#define REMVOL_SUPPORT_TEMP_FILE_H

#include "support/run_lock.h"
#include "support/text.h"

namespace remvol {

// A temporary file for one run at a time, made anew right before a command writes into it: neither a link or
// pipe that somebody has planted at its name, nor another run that uses the name, changes what is read back.
class TempFile {
 public:
  // Makes an empty file, 0600, at `path`. While another run uses that name it gets one of this process, which
  // is removed at the end.
  explicit TempFile(const char* path);
  TempFile(const TempFile&) = delete;
  TempFile& operator=(const TempFile&) = delete;
  ~TempFile();

  // The file's path.
  const char* path() const { return path_; }
  operator const char*() const { return path_; }

 private:
  RunLock lock_;
  PathText path_;
  bool own_name_ = false;
};

}  // namespace remvol

#endif
