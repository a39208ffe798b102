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
  // What the daemon is to be woken by changes with it.
  [[nodiscard]] bool running() const { return trust_ > 0; }

  // Counts a reply that has gone. A series may start to run by it.
  void count_reply();

  // Counts a wake-up of a running series, `came` with the next request or in vain. The series may end by it;
  // the next one takes twice as many replies to start.
  void count_wake_up(bool came);

 private:
  int trust_ = 0;
  int replies_ = 0;  // since no series runs
  int needed_ = 64;
};

}  // namespace ktree

#endif
