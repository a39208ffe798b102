// Commands that look and change nothing.
#ifndef PLATFORM_VV_SEARCH_COMMANDS_H
#define PLATFORM_VV_SEARCH_COMMANDS_H

#include <string>
#include <vector>

#include "vv/job.h"
#include "vv/options.h"
#include "vv/portal.h"

namespace vv {

int discover(const Options& options);
int luns(const Options& options);
int status(const Options& options);

// The names of the targets that the portal offers. Returns false after keeping why they cannot be had.
bool discover_targets(Job& job, const Portal& portal, std::vector<std::string>& names);

}  // namespace vv

#endif
