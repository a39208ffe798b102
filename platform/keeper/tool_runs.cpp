#include "keeper/tool_runs.h"

#include "common/processes.h"
#include "common/program.h"

namespace keeper {

using platform::kTool;
using platform::runs;

bool is_taken_down(const std::string& target) {
  return runs(kTool, {"--disconnect", "--system_off", "--deinit", "--del", "--modify"}, target);
}

bool is_unmounting(const std::string& target) {
  return is_taken_down(target) || runs(kTool, {"--del_lun", "--format", "--modify_address"}, target);
}

bool is_unwanted(const std::string& target) {
  return runs(kTool, {"--disconnect", "--del"}, target, platform::Names::kThatOne);
}

bool is_brought_up(const std::string& target) {
  return runs(kTool, {"--oiscsi_evt_recover"}) || runs(kTool, {"--connect", "--add", "--init"}, target);
}

bool is_busy(const std::string& target) {
  return is_unmounting(target) || is_brought_up(target);
}

}  // namespace keeper
