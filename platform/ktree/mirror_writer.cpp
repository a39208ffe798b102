#include "ktree/mirror_writer.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <utility>

namespace ktree {
namespace {

using mirror::Entry;
using mirror::kBytes;
using mirror::Key;
using mirror::Word;
using mirror::words_for;

constexpr size_t kPathRoom = mirror::kLongestPath;
constexpr size_t kPiece = 16384;  // words that memory is taken for at once
constexpr size_t kFewestHeads = 1024;
constexpr size_t kEntriesAHead = 4;  // on average, before there are more heads
constexpr size_t kSpareWords = 4;    // a value that has grown may grow again

// Puts an element behind `length` bytes of `path`. Returns the new length, or 0 when it gets too long.
size_t spell_element(char* path, size_t length, std::string_view name, unsigned number) {
  const size_t name_end = length + 1 + name.size();
  const size_t end = name_end + number_length(number);
  if (end > kPathRoom) return 0;
  path[length] = '/';
  name.copy(path + length + 1, name.size());
  for (size_t place = end; place > name_end; number /= 10)
    path[--place] = static_cast<char>('0' + number % 10);
  if (end > name_end) path[name_end] = ':';
  return end;
}

// The shortest spelling of `path`, with `number` for that of its last element. Returns its length, 0 when it
// is too long.
size_t spell(const Path& path, unsigned number, char* text) {
  size_t length = 0;
  for (size_t i = 0; i < path.depth; i++) {
    const Element& element = path.elements[i];
    length = spell_element(text, length, element.name(), i + 1 == path.depth ? number : element.number);
    if (length == 0) return 0;
  }
  return length;
}

unsigned last_number(const Path& path) {
  return path.elements[path.depth - 1].number;
}

// Calls visit(node, text, length) for the node at `path` and its later siblings of the same name.
template <typename Visit>
void for_later_siblings(const Tree& tree, const Path& path, Visit visit) {
  Path sibling = path;
  char text[kPathRoom];
  for (unsigned number = last_number(path); number <= kMaxNumber; number++) {
    sibling.elements[path.depth - 1].number = static_cast<uint16_t>(number);
    const Node* node = tree.find(sibling);
    const size_t length = node == nullptr ? 0 : spell(path, number, text);
    if (length == 0) return;
    visit(*node, text, length);
  }
}

// Calls visit(child, length) for the children of `node`, with their paths in `path`.
template <typename Visit>
void for_each_spelled_child(const Node& node, char* path, size_t length, Visit visit) {
  for_each_child(node, [&](const Node& child, unsigned number) {
    const size_t longer = spell_element(path, length, child.group->name, number);
    if (longer != 0) visit(child, longer);
  });
}

}  // namespace

// The time of a change: readers that meet it look again.
class MirrorWriter::Change {
 public:
  explicit Change(Word* words) : words_(words) {
    __atomic_store_n(&words_[mirror::kVersion], words_[mirror::kVersion] + 1, __ATOMIC_RELAXED);
    __atomic_thread_fence(__ATOMIC_RELEASE);
  }
  Change(const Change&) = delete;
  Change& operator=(const Change&) = delete;
  ~Change() { __atomic_store_n(&words_[mirror::kVersion], words_[mirror::kVersion] + 1, __ATOMIC_RELEASE); }

 private:
  Word* words_;
};

MirrorWriter::~MirrorWriter() {
  drop();
}

void MirrorWriter::drop() {
  if (words_ != nullptr) munmap(std::exchange(words_, nullptr), kBytes);
  if (fd_ >= 0) close(std::exchange(fd_, -1));
}

bool MirrorWriter::make() {
  reserved_ = 0;
  fd_ = memfd_create("ktree-mirror", MFD_CLOEXEC | MFD_ALLOW_SEALING);
  if (fd_ < 0 || ftruncate(fd_, kBytes) != 0) return false;
  void* words = mmap(nullptr, kBytes, PROT_READ | PROT_WRITE, MAP_SHARED, fd_, 0);
  if (words == MAP_FAILED) return false;
  words_ = static_cast<Word*>(words);
  return fcntl(fd_, F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_FUTURE_WRITE | F_SEAL_SEAL) == 0 &&
         reserve(kPiece);
}

int MirrorWriter::descriptor() {
  if (fd_ >= 0) return fd_;
  if (make()) {
    fill();
  } else {
    drop();
  }
  return fd_;
}

// Sees to it that the first `words` have memory: a page that the machine has none for would be a SIGBUS.
bool MirrorWriter::reserve(size_t words) {
  if (words <= reserved_) return true;
  const size_t wanted = (words + kPiece - 1) / kPiece * kPiece;
  if (wanted > mirror::kWords) return false;
  const auto begin = static_cast<off_t>(reserved_ * sizeof(Word));
  const auto size = static_cast<off_t>((wanted - reserved_) * sizeof(Word));
  if (fallocate(fd_, 0, begin, size) != 0) return false;
  reserved_ = wanted;
  store(mirror::kEnd, static_cast<Word>(reserved_));
  return true;
}

void MirrorWriter::store(size_t place, Word word) {
  __atomic_store_n(&words_[place], word, __ATOMIC_RELAXED);
}

void MirrorWriter::store_text(size_t place, std::string_view text) {
  for (size_t i = 0; i < text.size(); i += sizeof(Word)) {
    Word word = 0;
    text.copy(reinterpret_cast<char*>(&word), sizeof word, i);
    store(place + i / sizeof word, word);
  }
}

void MirrorWriter::store_value(const Entry& entry, std::string_view value) {
  store(entry.place + 1, static_cast<Word>(entry.path_bytes | value.size() << 8 | entry.room << 16));
  store_text(entry.value_place(), value);
}

// Also where no reader would look any more: what is deleted must not come back when the chain gets shorter.
bool MirrorWriter::find(const Key& key, Entry& entry) const {
  return find_entry(words_, key, entry, mirror::kWords);
}

// Takes the path's entry out of its chain, where there is one.
void MirrorWriter::take_out(const Key& key) {
  Entry entry = {};
  if (!find(key, entry)) return;
  size_t link = head_of(words_, key);  // the word that leads to the entry
  while (words_[link] != entry.place) link = words_[link];
  store(link, static_cast<Word>(entry.next));
  wasted_ += entry.words();
  entries_--;
}

// Puts a new entry in, as far as there is room.
void MirrorWriter::put(const Key& key, std::string_view value, size_t spare_words) {
  const size_t head = head_of(words_, key);
  const Entry entry = {used_, words_[head], key.bytes, value.size(), words_for(value.size()) + spare_words};
  if (value.size() > mirror::kLongestValue || !reserve(used_ + entry.words())) return;
  store(entry.place, static_cast<Word>(entry.next));
  store_text(entry.path_place(), {reinterpret_cast<const char*>(key.words), key.bytes});
  store_value(entry, value);
  store(head, static_cast<Word>(entry.place));
  used_ += entry.words();
  entries_++;
}

void MirrorWriter::set(std::string_view path, std::string_view value) {
  Key key;
  if (words_ == nullptr || !make_key(path, key)) return;
  {
    const Change change(words_);
    Entry entry = {};
    const bool held = find(key, entry);
    if (held && value.size() <= mirror::kLongestValue && words_for(value.size()) <= entry.room) {
      store_value(entry, value);
    } else {
      take_out(key);
      put(key, value, held ? kSpareWords : 0);
    }
  }
  refill_when_worn();
}

void MirrorWriter::before_removal(const Path& path) {
  if (words_ == nullptr) return;
  const Change change(words_);
  for_later_siblings(
      tree_, path, [&](const Node& node, char* text, size_t length) { take_out_below(node, text, length); });
}

void MirrorWriter::after_removal(const Path& path) {
  if (words_ == nullptr) return;
  {
    const Change change(words_);
    for_later_siblings(tree_, path,
                       [&](const Node& node, char* text, size_t length) { put_below(node, text, length); });
  }
  refill_when_worn();
}

void MirrorWriter::put_below(const Node& node, char* path, size_t length) {
  Key key;
  if (node.has_value() && make_key({path, length}, key)) put(key, node.value(), 0);
  for_each_spelled_child(node, path, length,
                         [&](const Node& child, size_t longer) { put_below(child, path, longer); });
}

void MirrorWriter::take_out_below(const Node& node, char* path, size_t length) {
  Key key;
  if (make_key({path, length}, key)) take_out(key);
  for_each_spelled_child(node, path, length,
                         [&](const Node& child, size_t longer) { take_out_below(child, path, longer); });
}

// Half of it is of no use any more, or there are too few heads for so many entries.
void MirrorWriter::refill_when_worn() {
  const size_t heads = words_[mirror::kHeadsCount];
  if ((wasted_ > kPiece && wasted_ > used_ / 2) || entries_ > heads * kEntriesAHead) fill();
}

void MirrorWriter::fill() {
  if (words_ == nullptr) return;
  const Change change(words_);
  size_t heads = std::max(kFewestHeads, std::bit_ceil(tree_.node_count() / 2));
  while (heads > kFewestHeads && !reserve(mirror::kFirstPlace + heads)) heads /= 2;
  store(mirror::kLayout, mirror::kThisLayout);
  store(mirror::kHeadsPlace, mirror::kFirstPlace);
  store(mirror::kHeadsCount, static_cast<Word>(heads));
  for (size_t i = 0; i < heads; i++) store(mirror::kFirstPlace + i, 0);
  used_ = mirror::kFirstPlace + heads;
  wasted_ = entries_ = 0;
  char path[kPathRoom];
  put_below(tree_.root(), path, 0);
}

}  // namespace ktree
