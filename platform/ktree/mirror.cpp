#include "ktree/mirror.h"

#include <cstring>

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
  // A colon of the same element came before, or there is no element yet that could have a number.
  bool numbered = true;
  for (const char *from = path.begin(), *end = path.end(); from != end;) {
    const auto* colon = static_cast<const char*>(memchr(from, ':', static_cast<size_t>(end - from)));
    const auto size = static_cast<size_t>((colon == nullptr ? end : colon) - from);
    if (key.bytes + size > kLongestPath) return false;
    memcpy(text + key.bytes, from, size);
    key.bytes += size;
    numbered = numbered && memchr(from, '/', size) == nullptr;
    if (colon == nullptr) break;
    const bool is_one = !numbered && ends_with_one(colon, static_cast<size_t>(end - colon));
    if (!is_one) text[key.bytes++] = ':';
    from = colon + (is_one ? 2 : 1);
    numbered = true;
  }
  if (key.bytes > kLongestPath) return false;
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
    const bool found = find_entry(words, key, entry, kMostSteps);
    const size_t size = entry.value_bytes < most ? entry.value_bytes : most;
    if (found) copy_value(words + entry.value_place(), buffer, size);
    __atomic_thread_fence(__ATOMIC_ACQUIRE);
    if (load(words[kVersion]) == version) return found ? static_cast<int>(size) : -1;
  }
  return -1;
}

}  // namespace ktree::mirror
