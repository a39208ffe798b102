// The daemon's side of the mirror; see mirror.h.
//
// Its memory is taken piece by piece, so that a machine without memory has values that must be asked for, and
// no signal kills the daemon.
#ifndef PLATFORM_KTREE_MIRROR_WRITER_H
#define PLATFORM_KTREE_MIRROR_WRITER_H

#include <string_view>

#include "ktree/mirror.h"
#include "ktree/path.h"
#include "ktree/tree.h"

namespace ktree {

class MirrorWriter {
 public:
  explicit MirrorWriter(const Tree& tree) : tree_(tree) {}
  MirrorWriter(const MirrorWriter&) = delete;
  MirrorWriter& operator=(const MirrorWriter&) = delete;
  ~MirrorWriter();

  // The memory file, made and filled at the first call; -1 while it cannot be had. Its size is sealed, and
  // nobody else can write it. Before that call there is no mirror, and all below do nothing.
  [[nodiscard]] int descriptor();

  // The value at `path`, in any spelling, has become `value`.
  void set(std::string_view path, std::string_view value);

  // Brackets the deletion of the node at `path`: it and its later siblings are taken out, what is there then
  // is put in.
  void before_removal(const Path& path);
  void after_removal(const Path& path);

  // Writes all of it anew, since the tree has become another one.
  void fill();

 private:
  class Change;

  [[nodiscard]] bool make();
  void drop();
  [[nodiscard]] bool reserve(size_t words);
  [[nodiscard]] bool find(const mirror::Key& key, mirror::Entry& entry) const;
  void store(size_t place, mirror::Word word);
  void store_text(size_t place, std::string_view text);
  void store_value(const mirror::Entry& entry, std::string_view value);
  void put(const mirror::Key& key, std::string_view value, size_t spare_words);
  void take_out(const mirror::Key& key);
  void put_below(const Node& node, char* path, size_t length);
  void take_out_below(const Node& node, char* path, size_t length);
  void refill_when_worn();

  const Tree& tree_;
  int fd_ = -1;
  mirror::Word* words_ = nullptr;
  size_t reserved_ = 0;  // words that have memory
  size_t used_ = 0;      // words
  size_t wasted_ = 0;    // of them, in entries that were taken out
  size_t entries_ = 0;
};

}  // namespace ktree

#endif
