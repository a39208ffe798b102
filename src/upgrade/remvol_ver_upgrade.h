// Brings stored settings of layout version 0 (one volume for each target) up to version 1 (LUNs below a
// target).
#ifndef REMVOL_UPGRADE_REMVOL_VER_UPGRADE_H
#define REMVOL_UPGRADE_REMVOL_VER_UPGRADE_H

namespace remvol {

constexpr int kSettingsVersion = 1;  // the layout that this tool reads and writes

// Reads the stored version, 0 when missing. Returns 0, or -1 for a null `version`.
[[nodiscard]] int get_remvol_ver_from_db(int* version);

// Gives the stored and the current version. Returns their absolute difference, or -1.
[[nodiscard]] int compare_remvol_ver(int* stored, int* current);

// Returns 1 when the stored version differs from the current one, else 0.
[[nodiscard]] int is_remvol_ver_changed();

// Stores `version`. Returns 0 or -1.
[[nodiscard]] int set_remvol_ver_to_db(int version);

// Deletes the flag that a firmware upgrade leaves.
void delete_fw_flag();

// Gives every version-0 target its one LUN. Returns 0, or -1 at the first target without a name or share, or
// write that failed; targets already converted stay so, and a later run converts again from the first.
int version_upgrade_v0_to_v1();

// Converts the settings when their version asks for it. Returns 0, or -1 when the conversion failed or the
// stored version is newer than this tool's.
[[nodiscard]] int version_upgrade();

}  // namespace remvol

#endif
