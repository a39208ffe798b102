// The file-sharing services of the appliance: every command to them stands here.
#ifndef REMVOL_VOLUME_SHARE_SERVICES_H
#define REMVOL_VOLUME_SHARE_SERVICES_H

namespace remvol {

// Has the SMB and AFP services reload their shares, whatever they report.
void reload_share_services();

// Has the SMB service alone reload its shares.
void reload_smb_shares();

}  // namespace remvol

#endif
