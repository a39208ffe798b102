#include "ktree/mirror.h"

#include <cstring>
#include <utility>

namespace ktree::mirror {
namespace {

constexpr int kTries = 4;

// Whether the text of `left` characters begins with the ":1" that ends an element; it means the same as no
// number.
bool ends_with_one(const char* text, size_t left) {
  return left >= 2 && text[1] == '1' && (left == 2 || text[2] == '/');
}

void copy_value(const Word* from, char* buffer, size_t size) {
  for (; size > 0; from++) {
    const Word word = load(*from);
    const size_t step = size < sizeof word ? size : sizeof word;
    memcpy(buffer, &word, step);
    buffer += step;
    size -= step;
  }
}

}  // namespace

bool make_key(std::string_view path, Key& key) {
  char* text = reinterpret_cast<char*>(key.words);
  key.bytes = 0;
  bool numbered = false;
  for (const char* from = path.begin(); from != path.end(); from++) {
    if (*from == '/') numbered = false;
    if (*from == ':' && !std::exchange(numbered, true) &&
        ends_with_one(from, static_cast<size_t>(path.end() - from))) {
      from++;
      continue;
    }
    if (key.bytes == kMaxPathBytes) return false;
    text[key.bytes++] = *from;
  }
  key.count = words_for(key.bytes);
  memset(text + key.bytes, 0, key.count * sizeof(Word) - key.bytes);
  key.hash = 0;
  for (size_t i = 0; i < key.count; i++) {
    key.hash = (key.hash ^ key.words[i]) * 0x9E3779B1U;
    key.hash ^= key.hash >> 15;
  }
  return true;
}

int read(const Word* words, std::string_view path, char* buffer, size_t most) {
  Key key;
  if (!make_key(path, key)) return -1;
  for (int i = 0; i < kTries; i++) {
    const Word version = __atomic_load_n(&words[kVersion], __ATOMIC_ACQUIRE);
    if (version % 2 != 0) continue;
    Entry entry = {};
    const bool found = find_entry(words, key, entry);
    const size_t size = entry.value_bytes < most ? entry.value_bytes : most;
    if (found) copy_value(words + entry.value_place(), buffer, size);
    __atomic_thread_fence(__ATOMIC_ACQUIRE);
    if (load(words[kVersion]) == version) return found ? static_cast<int>(size) : -1;
  }
  return -1;
}

}  // namespace ktree::mirror
