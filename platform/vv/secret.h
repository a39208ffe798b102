// Passwords: from a file, from standard input, or from a person.
#ifndef PLATFORM_VV_SECRET_H
#define PLATFORM_VV_SECRET_H

#include <string>

#include "vv/options.h"
#include "vv/tool.h"

namespace vv {

// Fills the credentials with the user of the options and the password that is asked for in the way that they
// say; leaves them alone when there is no user. Returns false when it cannot; `why`, printable text, says so
// then.
bool read_credentials(const Options& options, Credentials& credentials, std::string& why);

}  // namespace vv

#endif
