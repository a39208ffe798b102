// What `iscsiadm` prints, as records: the session listings and the discovery output. All that knows these
// texts is here. The functions are pure: a caller feeds them line by line, cut at kListingLineSize - 1 bytes,
// each with its newline if it has one.
#ifndef REMVOL_ISCSI_SESSION_LISTING_H
#define REMVOL_ISCSI_SESSION_LISTING_H

#include <cstddef>

namespace remvol {

inline constexpr size_t kListingLineSize = 512;

// Exit status of iscsiadm when there is no session at all; iscsiadm(8), EXIT STATUS.
inline constexpr int kNoSessionExit = 21;

// Returns whether a line of "iscsiadm -m session" shows a session to `name`: the first occurrence of the name
// is followed by neither a letter nor a digit. So "t1" is found in a line that shows only "t1-x".
[[nodiscard]] bool session_line_shows(const char* line, const char* name);

// Reader of "iscsiadm -m session -P 3", which lists one block for each target: its "Target" line, the state
// of its session, its SCSI host and its LUNs. The two readers below differ in their start values alone.
struct DetailedListing {
  int match;         // targets_seen at the wanted target's own line
  int targets_seen;  // "Target" lines so far
  int logged_in;     // 1 once a session of the wanted target is LOGGED_IN
  bool reads_host;   // whether the SCSI host number is wanted

  int host = 0;              // SCSI host number of the session
  int lun = 0;               // number of the LUN read last
  bool after_lun = false;    // the line before was a LUN line
  const char* disk = "";     // within the line read last: its text from the device name on
  size_t device_length = 0;  // length of the device name there
};

// With `match` equal to `targets_seen`, lines before the first "Target" line count as the wanted target's.
inline constexpr DetailedListing kDeviceListing = {0, 0, -1, false};
inline constexpr DetailedListing kLunListing = {-1, 0, 0, true};

enum class ListingLine {
  kOther,
  kHost,  // `host` was read
  kLun,   // `lun` was read
  kDisk,  // the disk of that LUN runs: the LUN is usable, `disk` and `device_length` are set
  kEnd,   // the next target's block has begun: nothing more to find
};

// Reads one line of the listing for the target called exactly `name`.
[[nodiscard]] ListingLine read_listing_line(DetailedListing* listing, const char* line, const char* name);

// Returns whether a line of a discovery ("ADDRESS:PORT,TAG NAME") begins with `address`. 10.0.0.1 also begins
// a line of 10.0.0.10.
[[nodiscard]] bool is_discovery_line_of(const char* line, const char* address);

// Copies the target name of a discovery line, the text after its first blank, into `name`. A "%" in it does
// not come out as it stands: the name is printed as a printf format with itself as the argument, which the
// names stored by earlier searches depend on. Since a portal chooses the name, only what is harmless of that
// is done: "%%" gives "%", a first "%s" gives the whole name, any other directive gives nothing. Returns
// false, with `name` unchanged, when the line has no blank.
[[nodiscard]] bool read_discovered_name(const char* line, char (&name)[kListingLineSize]);

// Returns whether a discovery line begins with `address`, shows `port` and contains `name` anywhere.
[[nodiscard]] bool discovery_line_offers(const char* line, const char* name, const char* address, int port);

}  // namespace remvol

#endif
