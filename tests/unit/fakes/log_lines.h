// The diagnostic log of the code under test, taken apart.
#ifndef FAKES_LOG_LINES_H
#define FAKES_LOG_LINES_H

#include <functional>
#include <string>
#include <vector>

namespace fakes {

// What the function logs when the debug level is `level`: a text "FILE:FUNCTION: MESSAGE" a line. Lines that
// are no log lines come as they are.
std::vector<std::string> logged(int level, const std::function<void()>& function);

}  // namespace fakes

#endif
