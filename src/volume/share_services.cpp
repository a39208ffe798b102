#include "volume/share_services.h"

#include <cstdlib>

namespace remvol {

int reload_share_services() {
  (void)!system("winshare_reload ; macshare_reload");
  return 0;
}

}  // namespace remvol
