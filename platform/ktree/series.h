// Whether a client asks one thing after the other, so that it pays to be awake for its next request.
//
// Such a client sends the next request as soon as it has taken a reply. A daemon that is woken by that, as a
// process that blocks in read(2) is (unix_write_space() in the kernel), has its processor out of its sleep
// when the request is there, which saves a sixth of the round trip between two processors. Where it wakes in
// vain too often, because the client does not go on at once or both share a processor, it had better sleep.
#ifndef PLATFORM_KTREE_SERIES_H
#define PLATFORM_KTREE_SERIES_H

namespace ktree {

class Series {
 public:
  [[nodiscard]] bool running() const { return trust_ > 0; }

  // Counts a reply that has gone. Returns true when a series starts to run by it.
  [[nodiscard]] bool starts();

  // Counts a wake-up of a running series, `came` with the next request or in vain. Returns true when the
  // series ends by it; the next one takes twice as many replies to start.
  [[nodiscard]] bool ends(bool came);

 private:
  int trust_ = 0;
  int replies_ = 0;  // since no series runs
  int needed_ = 64;
};

}  // namespace ktree

#endif
