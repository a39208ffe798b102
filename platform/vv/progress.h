// How a run of the tool gets on, as it says in the tree.
#ifndef PLATFORM_VV_PROGRESS_H
#define PLATFORM_VV_PROGRESS_H

#include <string>
#include <vector>

#include "vvstat/status.h"

namespace vv {

// What has happened to the target between two looks at it, a line for each step. Texts of users are made
// printable.
std::vector<std::string> steps_between(const vvstat::Target& before, const vvstat::Target& now);

// The volume of the target that is being formatted; null when there is none.
const vvstat::Volume* formatting(const vvstat::Target& target);

// The line of a format, of at most `width` cells: "Photos: formatting [#####     ] 50%".
std::string bar(const vvstat::Volume& volume, size_t width);

// Shows the steps of one target's volumes on standard error as they come, and on a terminal a bar while one
// is being formatted.
class Progress {
 public:
  // Remembers how the target is now; `shown` is false when nothing is to be said.
  Progress(const std::string& target, bool shown);

  // Looks again.
  void look();

  // Takes the bar away.
  ~Progress();
  Progress(const Progress&) = delete;
  Progress& operator=(const Progress&) = delete;

 private:
  void show_bar(const vvstat::Target& now);
  void clear_bar();

  std::string name_;
  bool shown_;
  bool terminal_;
  std::string bar_;  // as it is shown; empty: it is not
  vvstat::Target before_;
};

}  // namespace vv

#endif
