#include "volume/share_services.h"

#include <cstdlib>

namespace remvol {

namespace {

// A further service is a further command.
constexpr char kReloadAll[] = "winshare_reload ; macshare_reload";
constexpr char kReloadSmb[] = "winshare_reload";

}  // namespace

void reload_share_services() {
  (void)!system(kReloadAll);
}

void reload_smb_shares() {
  (void)!system(kReloadSmb);
}

}  // namespace remvol
