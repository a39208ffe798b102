#include "vvstat/status.h"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <string_view>

#include "tree_layout.h"

namespace vvstat {
namespace {

namespace key = remvol::key;

int number(std::string_view value, int fallback) {
  return value.empty() ? fallback : atoi(std::string(value).c_str());
}

constexpr std::string_view last_element(std::string_view key) {
  return key.substr(key.rfind('/') + 1);
}

// What stands in a key before the number of a slot.
constexpr std::string_view before_number(std::string_view key) {
  return key.substr(0, key.rfind("%d"));
}

constexpr std::string_view kTargetSlot = before_number(key::kTarget);
constexpr std::string_view kLunSlot =
    before_number(std::string_view(key::kLun).substr(std::string_view(key::kTarget).size()));

// Where a value of a slot goes.
template <typename Record>
struct Field {
  std::string_view name;
  void (*take)(Record& record, std::string_view value);
};

constexpr Field<Target> kTargetFields[] = {
    {last_element(key::kTargetName), [](Target& target, std::string_view value) { target.name = value; }},
    {last_element(key::kTargetIp), [](Target& target, std::string_view value) { target.address = value; }},
    {last_element(key::kTargetPort),
     [](Target& target, std::string_view value) { target.port = number(value, 0); }},
    {last_element(key::kTargetConnSet),
     [](Target& target, std::string_view value) { target.wanted = number(value, 0) != 0; }},
    {last_element(key::kTargetConnState),
     [](Target& target, std::string_view value) { target.connect_state = number(value, -1); }},
    {last_element(key::kTargetStatus), [](Target& target, std::string_view value) { target.status = value; }},
};

constexpr Field<Volume> kVolumeFields[] = {
    {last_element(key::kLunNumber),
     [](Volume& volume, std::string_view value) { volume.lun = number(value, -1); }},
    {last_element(key::kLunShare), [](Volume& volume, std::string_view value) { volume.share = value; }},
    {last_element(key::kLunStatus), [](Volume& volume, std::string_view value) { volume.status = value; }},
    {last_element(key::kLunEnable),
     [](Volume& volume, std::string_view value) { volume.enabled = number(value, 0) != 0; }},
    {last_element(key::kLunAccessRight),
     [](Volume& volume, std::string_view value) {
       volume.read_only = number(value, remvol::VOL_AC_RW) == remvol::VOL_AC_RO;
     }},
    {last_element(key::kLunFormatState),
     [](Volume& volume, std::string_view value) { volume.format_state = number(value, -1); }},
    {last_element(key::kLunFormatProgress),
     [](Volume& volume, std::string_view value) { volume.progress = std::clamp(number(value, 0), 0, 100); }},
    {last_element(key::kLunVolumeState),
     [](Volume& volume, std::string_view value) { volume.volume_state = number(value, -1); }},
    {last_element(key::kLunFsType),
     [](Volume& volume, std::string_view value) { volume.file_system = value; }},
    {last_element(key::kLunDev), [](Volume& volume, std::string_view value) { volume.device = value; }},
    {last_element(key::kLunMnt), [](Volume& volume, std::string_view value) { volume.mount_point = value; }},
};

template <typename Record, size_t kCount>
void take_field(const Field<Record> (&fields)[kCount], Record& record, std::string_view name,
                std::string_view value) {
  for (const Field<Record>& field : fields) {
    if (field.name == name) return field.take(record, value);
  }
}

// Takes `before` and a number from 1 to `most` off the front of a path. Returns 0, and leaves the path as it
// is, when they are not there.
size_t take_slot(std::string_view& path, std::string_view before, size_t most) {
  if (!path.starts_with(before)) return 0;
  const char* const end = path.data() + path.size();
  size_t slot = 0;
  const char* const behind = std::from_chars(path.data() + before.size(), end, slot).ptr;
  if (slot == 0 || slot > most || (behind != end && *behind != '/')) return 0;
  path.remove_prefix(static_cast<size_t>(behind - path.data()));
  return slot;
}

// The record of a slot. It stays where it is: there is room for the most.
template <typename Record>
Record& record_of(std::vector<Record>& records, size_t slot, size_t most) {
  records.reserve(most);
  if (records.size() < slot) records.resize(slot);
  return records[slot - 1];
}

// Puts the values of a listing where they belong. Those of one node follow each other, so its slot is looked
// for once.
class Slots {
 public:
  void take(std::string_view path, std::string_view value) {
    const size_t slash = path.rfind('/');
    if (slash == std::string_view::npos) return;
    if (path.substr(0, slash) != node_) enter(path.substr(0, slash));
    path.remove_prefix(slash + 1);
    if (volume_ != nullptr) {
      take_field(kVolumeFields, *volume_, path, value);
    } else if (target_ != nullptr) {
      take_field(kTargetFields, *target_, path, value);
    }
  }

  std::vector<Target> taken() { return std::move(targets_); }

 private:
  void enter(std::string_view node) {
    node_ = node;
    target_ = nullptr;
    volume_ = nullptr;
    const size_t slot = take_slot(node, kTargetSlot, remvol::kMaxTargets);
    if (slot == 0) return;
    Target& target = record_of(targets_, slot, remvol::kMaxTargets);
    const size_t lun = take_slot(node, kLunSlot, remvol::kMaxLunsPerTarget);
    if (!node.empty()) return;
    if (lun == 0) {
      target_ = &target;
    } else {
      volume_ = &record_of(target.volumes, lun, remvol::kMaxLunsPerTarget);
    }
  }

  std::vector<Target> targets_;
  std::string_view node_;  // whose record one of these is, if it is a slot
  Target* target_ = nullptr;
  Volume* volume_ = nullptr;
};

// Slots are used from the first one on; what stands behind a free one is left over from something.
template <typename Record, typename IsFree>
void end_at_free(std::vector<Record>& records, IsFree is_free) {
  records.erase(std::find_if(records.begin(), records.end(), is_free), records.end());
}

}  // namespace

Status read_status(const platform::TreeListing& tree) {
  Slots slots;
  tree.for_each([&slots](std::string_view path, std::string_view value) { slots.take(path, value); });
  Status status{tree.answered(), slots.taken()};
  end_at_free(status.targets, [](const Target& target) { return target.name.empty(); });
  for (Target& target : status.targets) {
    end_at_free(target.volumes, [](const Volume& volume) { return volume.lun == -1; });
  }
  return status;
}

}  // namespace vvstat
