// How far mke2fs is, from what it prints. It announces each phase and redraws a counter "n/m" behind it with
// backspaces; hundreds of redraws may arrive in one read.
#ifndef REMVOL_VOLUME_FORMAT_PROGRESS_H
#define REMVOL_VOLUME_FORMAT_PROGRESS_H

namespace remvol {

// Longest text of one read, with its NUL.
inline constexpr int kFormatReadSize = 1024;

// What the reads so far told. Starts all zero.
struct FormatProgress {
  bool groups_seen;  // "Allocating group tables" was announced
  bool inodes_seen;  // "Writing inode tables" was announced
  // 10 to 30 while group tables are allocated, 30 to 100 while inode tables are written. The counter of the
  // superblocks, which follows, runs from 30 to 100 again.
  int percent;
};

// Takes the text of one read (at most kFormatReadSize - 1 characters) into `progress`. Returns whether it
// carried a counter; the percentage is published then. The counter used is the one before the last redraw of
// the read. A counter of "n/0" counts as none.
[[nodiscard]] bool update_format_progress(FormatProgress* progress, const char* text);

}  // namespace remvol

#endif
