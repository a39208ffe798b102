// The mirror: values of the tree that clients read without asking the daemon.
//
// The daemon keeps every short value, by the shortest spelling of its path, in a memory file as well, which
// its clients map for reading. The first word is the version of a sequence lock: odd while the daemon changes
// something, another even number afterwards. A reader that finds the same even version before and after has
// read one moment of the tree. What it does not find it has to ask for: the mirror need not hold everything.
//
// The file is an array of words of 32 bits in the byte order of the machine; a place is a word's number in
// it:
//   0        the version
//   1, 2     the place of the heads, and how many there are
//   3        how many words have memory; it never gets less
//   4        the number of this layout: a library may meet the daemon of another version
//   a head   by the hash of a path: the place of the first entry, 0 for none
//   an entry the place of the next entry of the same head; the sizes: bytes of the path, bytes of the value
//            << 8, room for the value in words << 16; the path and then the value, each filled up with zeros
//            to whole words
// Every word is read and written as one, so that what a reader sees in the middle of a change is wrong but
// never undefined: all that it takes for a place or a size is checked.
#ifndef PLATFORM_KTREE_MIRROR_H
#define PLATFORM_KTREE_MIRROR_H

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace ktree::mirror {

using Word = uint32_t;

// The size of the file; memory is taken for what is used of it.
constexpr size_t kBytes = size_t{64} << 20;
constexpr size_t kWords = kBytes / sizeof(Word);

constexpr size_t kLongestPath = 255;
constexpr size_t kLongestValue = 255;

[[nodiscard]] constexpr size_t words_for(size_t bytes) {
  return (bytes + sizeof(Word) - 1) / sizeof(Word);
}

constexpr size_t kVersion = 0;
constexpr size_t kHeadsPlace = 1;
constexpr size_t kHeadsCount = 2;
constexpr size_t kEnd = 3;
constexpr size_t kLayout = 4;
constexpr size_t kFirstPlace = 5;
constexpr size_t kEntryHeader = 2;

// To be counted up with every change of the words, of make_key() or of kBytes.
constexpr Word kThisLayout = 1;

[[nodiscard]] inline Word load(const Word& word) {
  return __atomic_load_n(&word, __ATOMIC_RELAXED);
}

// A path as the entries hold it.
struct Key {
  Word words[words_for(kLongestPath)];
  size_t count;
  size_t bytes;
  Word hash;
};

// Puts the shortest spelling of a path, which is without every ":1", into `key`. Returns false when it is too
// long.
[[nodiscard]] bool make_key(std::string_view path, Key& key);

// Behind the last word that has memory. To look at one without would take a page of it, or be a SIGBUS when
// there is none.
[[nodiscard]] inline size_t end_of(const Word* words) {
  const size_t end = load(words[kEnd]);
  return end < kWords ? end : kWords;
}

// The place of the key's head, 0 when the words hold none.
[[nodiscard]] inline size_t head_of(const Word* words, const Key& key) {
  const size_t place = load(words[kHeadsPlace]);
  const size_t count = load(words[kHeadsCount]);
  const size_t end = end_of(words);
  return count == 0 || place < kFirstPlace || place > end || count > end - place ? 0
                                                                                 : place + key.hash % count;
}

struct Entry {
  size_t place;
  size_t next;
  size_t path_bytes;
  size_t value_bytes;
  size_t room;  // words

  [[nodiscard]] size_t path_place() const { return place + kEntryHeader; }
  [[nodiscard]] size_t value_place() const { return path_place() + words_for(path_bytes); }
  [[nodiscard]] size_t words() const { return kEntryHeader + words_for(path_bytes) + room; }
};

// Returns false when there can be no entry.
[[nodiscard]] inline bool load_entry(const Word* words, size_t place, Entry& entry) {
  const size_t end = end_of(words);
  if (place < kFirstPlace || place > end || end - place < kEntryHeader) return false;
  const Word sizes = load(words[place + 1]);
  entry = {place, load(words[place]), sizes & 0xFFU, (sizes >> 8) & 0xFFU, sizes >> 16};
  return words_for(entry.value_bytes) <= entry.room && entry.words() <= end - place;
}

[[nodiscard]] inline bool has_path(const Word* words, const Entry& entry, const Key& key) {
  if (entry.path_bytes != key.bytes) return false;
  for (size_t i = 0; i < key.count; i++) {
    if (load(words[entry.path_place() + i]) != key.words[i]) return false;
  }
  return true;
}

// How far a reader follows a chain: what is changed meanwhile may look like a circle.
constexpr size_t kMostSteps = 1000;

// Returns false when there is no entry of the path among the first `most_steps` of its chain.
[[nodiscard]] inline bool find_entry(const Word* words, const Key& key, Entry& entry, size_t most_steps) {
  const size_t head = head_of(words, key);
  size_t place = head == 0 ? 0 : load(words[head]);
  for (size_t i = 0; i < most_steps && load_entry(words, place, entry); i++) {
    if (has_path(words, entry, key)) return true;
    place = entry.next;
  }
  return false;
}

// Reads at most `most` bytes of the value at `path` into `buffer`. Returns their number, or -1 when the
// daemon is to be asked.
[[nodiscard]] int read(const Word* words, std::string_view path, char* buffer, size_t most);

}  // namespace ktree::mirror

#endif
