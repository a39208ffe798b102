// The layout of the configuration tree: what the tool writes there and the platform's programs read, and the
// other way round. docs/tree-layout.md says what each value means.
#ifndef REMVOL_TREE_LAYOUT_H
#define REMVOL_TREE_LAYOUT_H

namespace remvol {

// The tree's instances: the tool's settings and status, and the machine's general tree, which also takes what
// a search finds.
inline constexpr char kVolumesSocket[] = "/var/run/ktree_sock_vv";
inline constexpr char kGeneralSocket[] = "/var/run/ktree_sock";

// What the first is dumped to after a command, and loaded from at start-up.
inline constexpr char kSettingsFile[] = "/etc/NAS_CFG/vv.xml";

// Where volumes are mounted, each on a folder of its share's name.
inline constexpr char kMountRoot[] = "/mnt/VV/";

// How much there may be. A build may be told other numbers, to see what they would cost: cmake/options.cmake.
#ifndef REMVOL_MAX_TARGETS
#define REMVOL_MAX_TARGETS 8
#define REMVOL_MAX_LUNS_PER_TARGET 8
#define REMVOL_MAX_LUNS 8
#endif
constexpr int kMaxTargets = REMVOL_MAX_TARGETS;                // target slots, dbidx 1 to 8
constexpr int kMaxLunsPerTarget = REMVOL_MAX_LUNS_PER_TARGET;  // LUN slots of a target, dbidx 1 to 8
constexpr int kMaxLuns = REMVOL_MAX_LUNS;                      // LUNs in the whole system
constexpr int kMaxRecoverQueue = 100;                          // names in the recover queue

enum ConnectState : int {
  kDisconnected = 0,
  kConnected = 1,
  kConnecting = 2,
  kRecovering = 3,  // connection lost, being reopened
  kConnectError = 4,
};

enum FormatState : int {
  kFormatIdle = 0,
  kFormatting = 1,
  kFormatFailed = 3,
  kFormatWaiting = 4,  // for the format semaphore
};

enum VolumeState : int {
  kVolumeNormal = 0,
  kVolumeCreating = 1,
  kVolumeOffline = 2,
  kVolumeFailed = 3,
  kVolumeLost = 4,  // at start-up the session showed no usable disk
  kVolumeUnsupported = 5,
};

enum AccessRight : int { VOL_AC_RO = 0, VOL_AC_RW = 1 };

// Outcome of a LUN search.
enum SearchCode : int {
  kLunSearchDone = 0,
  kLunSearchLoginFailed = 100,
};

}  // namespace remvol

// Keys. In those of a target and of a LUN the first %d is the target's slot, the second the LUN's; in the
// queue and search keys it is the entry's number. All count from 1.
namespace remvol::key {

#define INITIATOR "/iscsi/initiator"
#define TARGET INITIATOR "/id:%d"
#define LUN TARGET "/lun/id:%d"

// Settings and state of the whole initiator.
inline constexpr char kInitiator[] = INITIATOR;
inline constexpr char kInitiatorName[] = INITIATOR "/iqn";
inline constexpr char kInitiatorPrefix[] = INITIATOR "/prefix";
inline constexpr char kVersion[] = INITIATOR "/ver";
inline constexpr char kFirmwareUpgrade[] = INITIATOR "/fwupgrade";
inline constexpr char kDebugLevel[] = INITIATOR "/dbg";
inline constexpr char kTargetCount[] = INITIATOR "/count";
inline constexpr char kTotalLunCount[] = INITIATOR "/total_lun_count";

// A target. Its name defines the slot.
inline constexpr char kTarget[] = TARGET;
inline constexpr char kTargetName[] = TARGET "/target";
inline constexpr char kTargetIp[] = TARGET "/ip";
inline constexpr char kTargetPort[] = TARGET "/port";
inline constexpr char kTargetChap[] = TARGET "/chap";
inline constexpr char kTargetChapName[] = TARGET "/chap_name";
inline constexpr char kTargetChapPwd[] = TARGET "/chap_pwd";
inline constexpr char kTargetConnSet[] = TARGET "/conn_set";
inline constexpr char kTargetConnState[] = TARGET "/conn_state";
inline constexpr char kTargetStatus[] = TARGET "/status";
inline constexpr char kTargetLunCount[] = TARGET "/lun/count";

// A LUN. Its number defines the slot.
inline constexpr char kLun[] = LUN;
inline constexpr char kLunNumber[] = LUN "/lun";
inline constexpr char kLunShare[] = LUN "/share";
inline constexpr char kLunEnable[] = LUN "/enable";
inline constexpr char kLunAccessRight[] = LUN "/vol_access_right";
inline constexpr char kLunFormatState[] = LUN "/format_state";
inline constexpr char kLunFormatProgress[] = LUN "/format_progress";
inline constexpr char kLunVolumeState[] = LUN "/volume_state";
inline constexpr char kLunStatus[] = LUN "/status";
inline constexpr char kLunSize[] = LUN "/size";
inline constexpr char kLunFsType[] = LUN "/fs_type";
inline constexpr char kLunDev[] = LUN "/dev";
inline constexpr char kLunMntDev[] = LUN "/mnt_dev";
inline constexpr char kLunMnt[] = LUN "/mnt";

// Layout version 0 kept these directly under the target; only the settings upgrade reads them.
inline constexpr char kOldShare[] = TARGET "/share";
inline constexpr char kOldFormatState[] = TARGET "/format_state";
inline constexpr char kOldFormatProgress[] = TARGET "/format_progress";
inline constexpr char kOldVolumeState[] = TARGET "/volume_state";

// Run-time only: names of targets that wait for recovery, oldest first.
inline constexpr char kRecoverEntry[] = "/temp/remvol/recover/queue/id:%d";
inline constexpr char kRecoverName[] = "/temp/remvol/recover/queue/id:%d/target_name";

// Outcome of a command, followed by a slash and the command's name.
inline constexpr char kResult[] = "/result";

// Owned by the network manager.
inline constexpr char kBondingEnable[] = "/network_mgr/bonding/enable";

// Everything that lasts no longer than a run of the machine.
inline constexpr char kTemporary[] = "/temp";

// Results of a target discovery and of a LUN search. "avaliable" is spelled as its readers know it.
inline constexpr char kSearch[] = "/temp/vv_search";
inline constexpr char kSearchName[] = "/temp/vv_search/id:%d/name";
inline constexpr char kSearchDone[] = "/temp/vv_search/search_done";
inline constexpr char kLunSearch[] = "/temp/vv_search_lun";
inline constexpr char kLunSearchTarget[] = "/temp/vv_search_lun/target_name";
inline constexpr char kLunSearchError[] = "/temp/vv_search_lun/err_code";
inline constexpr char kLunSearchCount[] = "/temp/vv_search_lun/lun/count";
inline constexpr char kLunSearchLun[] = "/temp/vv_search_lun/lun/id:%d/lun";
inline constexpr char kLunSearchSize[] = "/temp/vv_search_lun/lun/id:%d/size";
inline constexpr char kLunSearchAvailable[] = "/temp/vv_search_lun/lun/id:%d/avaliable";
inline constexpr char kLunSearchFsType[] = "/temp/vv_search_lun/lun/id:%d/fstype";

#undef LUN
#undef TARGET
#undef INITIATOR

}  // namespace remvol::key

#endif
