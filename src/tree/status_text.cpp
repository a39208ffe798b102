#include "tree/status_text.h"

#include <algorithm>
#include <cstring>
#include <iterator>

namespace remvol {

namespace {

constexpr char kConnectingText[] = "Connecting";
constexpr char kFormattingText[] = "Formatting";
constexpr char kWaitingText[] = "Wait to Format";
constexpr char kCreatingText[] = "Creating Volume";

// What the texts of work begin with.
constexpr const char* kWorkTexts[] = {kConnectingText, kFormattingText, kWaitingText, kCreatingText};

// The text, marked when the volume is read-only.
StatusText with_right(const char* text, int right) {
  return right == VOL_AC_RO ? StatusText("%s ( %s )", text, "Read Only") : StatusText("%s", text);
}

bool failed(const LunState& state) {
  return state.format == kFormatFailed || state.volume == kVolumeFailed;
}

}  // namespace

TargetStatus target_status(bool connected, int state) {
  if (connected) return {"Connected", kConnected};
  if (state == kConnecting) return {kConnectingText, kConnecting};
  if (state != kConnectError) return {"Disconnected", kDisconnected};
  return {"Connect Error", -1};
}

StatusText formatting_text(int progress) {
  return StatusText("%s %d%%", kFormattingText, progress);
}

StatusText running_text(int right) {
  return with_right("Running", right);
}

StatusText unmounted_text(const LunState& state, int right, int progress) {
  if (state.format == kFormatting) return formatting_text(progress);
  if (state.volume == kVolumeCreating) return StatusText(kCreatingText);
  if (state.volume == kVolumeUnsupported) return with_right("Unsupported File System", right);
  if (!failed(state)) return StatusText(kLunOffline);
  return with_right("Create Volume Failed", right);
}

StatusText unformatted_text(const LunState& state, int right, int progress) {
  if (state.format == kFormatting) return formatting_text(progress);
  if (state.format == kFormatWaiting) return StatusText(kWaitingText);
  if (state.volume == kVolumeCreating) return StatusText(kCreatingText);
  if (failed(state)) return with_right("Create Volume Failed", right);
  if (state.volume == kVolumeOffline) return StatusText(kLunOffline);
  // The user interface knows no read-only form of this text here.
  if (state.volume == kVolumeUnsupported) return StatusText("Unsupported File System");
  return with_right("No Format", right);
}

bool tells_of_work(const char* text) {
  return std::any_of(std::begin(kWorkTexts), std::end(kWorkTexts),
                     [text](const char* work) { return strncmp(text, work, strlen(work)) == 0; });
}

}  // namespace remvol
