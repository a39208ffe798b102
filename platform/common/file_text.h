// Text of files.
#ifndef PLATFORM_COMMON_FILE_TEXT_H
#define PLATFORM_COMMON_FILE_TEXT_H

#include <string>

namespace platform {

// All of a file that has positions, as far as it can be read. The position of the descriptor does not matter,
// and stays.
std::string content_of(int file);

}  // namespace platform

#endif
