// Runs of the tool that what is missing may be missing for, or come back by.
#ifndef PLATFORM_KEEPER_TOOL_RUNS_H
#define PLATFORM_KEEPER_TOOL_RUNS_H

#include <string>

namespace keeper {

// True when a run takes the target's session, or any without a target, away because somebody wants it to.
bool is_taken_down(const std::string& target = {});

// True when a run may unmount volumes of the target because somebody wants it to.
bool is_unmounting(const std::string& target);

// True when a run takes the wish that the target be connected away; one that ends all sessions leaves it.
bool is_unwanted(const std::string& target);

// True when a run may connect the target, or mount volumes of it. One recovery may take over another.
bool is_brought_up(const std::string& target);

// True when a run does any of these to the target.
bool is_busy(const std::string& target);

}  // namespace keeper

#endif
