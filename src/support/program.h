// The program that runs: how it was called.
#ifndef REMVOL_SUPPORT_PROGRAM_H
#define REMVOL_SUPPORT_PROGRAM_H

namespace remvol {

// argv[0], set once by main. It is also how the tool starts itself again.
extern char program_path[4096];

// Returns the last component of `program_path`: the text after its last slash, or all of it. The tool's
// temporary files are named after it.
[[nodiscard]] const char* program_name();

}  // namespace remvol

#endif
