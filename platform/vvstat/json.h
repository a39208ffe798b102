// The status for programs.
#ifndef PLATFORM_VVSTAT_JSON_H
#define PLATFORM_VVSTAT_JSON_H

#include <string>

#include "status.h"

namespace vvstat {

// The form of the text: a reader may rely on every member that a version has; a further member is no new
// version.
inline constexpr int kJsonVersion = 1;

// The status as JSON on one line. Text that is not UTF-8 is shown with \xHH for its bytes. Secrets are not in
// it.
std::string json(const Status& status);

}  // namespace vvstat

#endif
