// Why something failed, and what a person does about it.
#ifndef PLATFORM_VV_EXPLANATION_H
#define PLATFORM_VV_EXPLANATION_H

#include <string>
#include <string_view>
#include <vector>

#include "vvstat/health.h"

namespace vv {

struct Failure {
  std::string step;                  // that failed, such as "login"
  std::string why;                   // a sentence without its full stop
  std::string advice;                // what to try; empty when nothing is known
  std::vector<std::string> details;  // lines of the tool and of the kernel, as they came
};

// What stands in an advice for a name that is known where it is told: of the share, of the portal, and of
// this machine as an initiator. One advice has one of them.
inline constexpr char kShareToName[] = "SHARE", kPortalToName[] = "PORTAL", kMachineToName[] = "MACHINE";

// The steps that can fail, as they are named.
inline constexpr char kDiscoveryStep[] = "discovery", kLoginStep[] = "login", kLunsStep[] = "LUN search",
                      kStoreStep[] = "settings", kDiskStep[] = "disk", kFormatStep[] = "format",
                      kMountStep[] = "mount", kUnmountStep[] = "unmount", kLogoutStep[] = "logout",
                      kToolStep[] = "start of the tool";

// What is known of the failure from what the tool and its commands printed: their last word on it is in
// `why`, or it is empty when nothing in it tells.
Failure explain_output(std::string_view output, const char* step);

// Why a volume is not as it should be after the tool was to bring it up, from the tree, the kernel and what
// the tool printed.
Failure explain_volume(const vvstat::Row& row, std::string_view output);

// What a run that succeeded could not do all the same, such as to save the settings.
std::vector<std::string> warnings_in(std::string_view output);

// Lines of the tool's own log, without their prefix, that tell of a failure, and those of the commands that
// it ran.
std::vector<std::string> telling_lines(std::string_view output);

}  // namespace vv

#endif
