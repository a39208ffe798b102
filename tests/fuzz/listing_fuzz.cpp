// All readers of what iscsiadm prints, on any text. The target is one of the samples'.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "iscsi/session_listing.h"

using namespace remvol;

namespace {

constexpr char kName[] = "iqn.2026-01.org.example:t1";

void require(bool holds) {
  if (!holds) abort();
}

void read_detailed(DetailedListing* listing, const char* line) {
  const ListingLine what = read_listing_line(listing, line, kName);
  require(listing->match <= listing->targets_seen);
  if (what != ListingLine::kDisk) return;
  require(listing->logged_in == 1);
  require(listing->disk >= line && listing->disk + listing->device_length <= line + strlen(line));
}

void read_discovery(const char* line) {
  char name[kListingLineSize];
  memset(name, 'x', sizeof name);
  if (read_discovered_name(line, name)) require(memchr(name, '\0', sizeof name) != nullptr);
  require(!discovery_line_offers(line, kName, "10.0.0.1", 3260) || is_discovery_line_of(line, "10.0.0.1"));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  DetailedListing devices = kDeviceListing;
  DetailedListing luns = kLunListing;
  if (size == 0) return 0;
  FILE* file = fmemopen(const_cast<uint8_t*>(data), size, "r");
  char line[kListingLineSize];
  while (fgets(line, sizeof line, file) != nullptr) {
    // On the heap in its own size, so that the sanitizer sees a read beyond it.
    const std::string exact(line);
    require(!session_line_shows(exact.c_str(), kName) || strstr(exact.c_str(), kName) != nullptr);
    read_detailed(&devices, exact.c_str());
    read_detailed(&luns, exact.c_str());
    read_discovery(exact.c_str());
  }
  fclose(file);
  return 0;
}
