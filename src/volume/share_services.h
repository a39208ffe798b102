// The file-sharing services of the appliance.
#ifndef REMVOL_VOLUME_SHARE_SERVICES_H
#define REMVOL_VOLUME_SHARE_SERVICES_H

namespace remvol {

// Has the SMB and AFP services reload their shares. Returns 0, whatever they report.
int reload_share_services();

}  // namespace remvol

#endif
