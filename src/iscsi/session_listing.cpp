#include "iscsi/session_listing.h"

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <utility>

#include "support/text.h"

namespace remvol {

namespace {

using std::string_view;

constexpr string_view kTargetLine = "Target";
constexpr string_view kSessionState = "iSCSI Session State: ";
constexpr string_view kHostNumber = "Host Number: ";
constexpr string_view kLunNumber = "Lun: ";
constexpr string_view kAttachedDisk = "Attached scsi disk";

// In place of substr(), remove_prefix() and remove_suffix(), which would make the tool load the C++ library
// for the case that there is less text.
string_view behind(string_view text, size_t length) {
  return {text.data() + length, text.size() - length};
}

string_view without_end(string_view text, string_view end) {
  return text.ends_with(end) ? string_view(text.data(), text.size() - end.size()) : text;
}

string_view without_newline(string_view line) {
  return without_end(line, "\n");
}

// Since 2.0.874 iscsiadm says behind the name whether the kernel made the session at boot from flash.
string_view without_flash_mark(string_view line) {
  const string_view text = without_end(line, " (non-flash)");
  return text.size() < line.size() ? text : without_end(line, " (flash)");
}

bool is_line_of_target(string_view line, string_view name) {
  const string_view text = without_flash_mark(without_newline(line));
  const size_t blank = text.rfind(' ');
  return blank != string_view::npos && behind(text, blank + 1) == name;
}

// Puts the text behind the first `label` into `value`. Returns false when the line does not contain it.
bool read_value(string_view line, string_view label, string_view* value) {
  const size_t at = line.find(label);
  if (at == string_view::npos) return false;
  *value = behind(line, at + label.size());
  return true;
}

// `text` is what follows the disk label: a blank, the device name, a TAB and the state of the disk.
ListingLine read_disk(DetailedListing* listing, string_view text) {
  if (text.empty()) return ListingLine::kOther;  // cut right behind the label
  text = behind(text, 1);
  if (text.find("running") == string_view::npos) return ListingLine::kOther;
  listing->disk = text.data();
  // A kernel name holds no white space: without a TAB, any of it ends the name.
  const size_t end = text.find_first_of(text.find('\t') != string_view::npos ? "\t" : " \r\n");
  listing->device_length = end != string_view::npos ? end : text.size();
  return ListingLine::kDisk;
}

}  // namespace

bool session_line_shows(const char* line, const char* name) {
  const char* found = strstr(line, name);
  return found != nullptr && isalnum(static_cast<unsigned char>(found[strlen(name)])) == 0;
}

ListingLine read_listing_line(DetailedListing* listing, const char* line, const char* name) {
  const string_view text(line);
  string_view value;
  // The line after a LUN line belongs to that LUN only when it tells of a disk. 2.1.8 prints none for a LUN
  // without a disk, such as an array's controller at LUN 0: what follows is then the next LUN's line, or
  // another target's, and is read as that. Swallowing it would lose the LUN, or take the other target's
  // disks for ours.
  if (std::exchange(listing->after_lun, false) && read_value(text, kAttachedDisk, &value)) {
    return read_disk(listing, value);
  }
  if (text.starts_with(kTargetLine)) {
    listing->targets_seen++;
    if (is_line_of_target(text, name)) listing->match = listing->targets_seen;
    return ListingLine::kOther;
  }
  const bool inside = listing->match == listing->targets_seen;
  if (inside && read_value(text, kSessionState, &value)) {
    if (value.find("LOGGED_IN") != string_view::npos) listing->logged_in = 1;
    return ListingLine::kOther;
  }
  if (inside && listing->reads_host && read_value(text, kHostNumber, &value)) {
    listing->host = atoi(value.data());
    return ListingLine::kHost;
  }
  if (inside && listing->logged_in >= 1 && read_value(text, kLunNumber, &value)) {
    listing->lun = atoi(value.data());
    listing->after_lun = true;
    return ListingLine::kLun;
  }
  const bool behind = listing->match >= 1 && listing->targets_seen > listing->match;
  return behind ? ListingLine::kEnd : ListingLine::kOther;
}

bool is_discovery_line_of(const char* line, const char* address) {
  return string_view(line).starts_with(address);
}

namespace {

// A text of at most kListingLineSize - 1 bytes that grows at its end.
struct NameWriter {
  char (&name)[kListingLineSize];
  size_t length = 0;

  void append(string_view text) {
    const size_t taken = text.copy(name + length, kListingLineSize - 1 - length);
    length += taken;
    name[length] = '\0';
  }
};

// Appends what printf would print for the directive at the beginning of `text`, behind its "%", with `whole`
// as the argument. Returns the length of the directive.
size_t append_directive(NameWriter* out, string_view text, string_view whole, bool* has_argument) {
  if (text.starts_with('%')) {
    out->append("%");
    return 1;
  }
  if (text.starts_with('s') && *has_argument) out->append(whole);
  *has_argument = false;
  const size_t conversion = text.find_first_not_of("0123456789 #'*+-.$hjlLqtzZ");
  return conversion != string_view::npos ? conversion + 1 : text.size();
}

}  // namespace

bool read_discovered_name(const char* line, char (&name)[kListingLineSize]) {
  string_view text = without_newline(line);
  const size_t blank = text.find(' ');
  if (blank == string_view::npos) return false;
  const string_view whole = behind(text, blank + 1);
  NameWriter out{name};
  out.append("");
  bool has_argument = true;
  text = whole;
  for (size_t at = text.find('%'); at != string_view::npos; at = text.find('%')) {
    out.append(string_view(text.data(), at));
    text = behind(text, at + 1);
    text = behind(text, append_directive(&out, text, whole, &has_argument));
  }
  out.append(text);
  return true;
}

bool discovery_line_offers(const char* line, const char* name, const char* address, int port) {
  return is_discovery_line_of(line, address) && strstr(line, NumberText(":%d,", port)) != nullptr &&
         strstr(line, name) != nullptr;
}

}  // namespace remvol
