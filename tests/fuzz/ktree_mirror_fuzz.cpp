// A mirror whose words are anything at all, as a reader may find it in the middle of a change: a read ends,
// stays inside, and gives no more than was asked for.
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "ktree/mirror.h"
#include "require.h"

using namespace ktree;
using mirror::Word;

namespace {

constexpr size_t kHeads = 1024;
constexpr size_t kFirstEntry = mirror::kFirstPlace + kHeads;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const std::string path = "/iscsi/initiator/id:2/share";
  // Exactly as long as it is: a read outside is seen.
  static std::vector<Word> words(mirror::kWords);
  mirror::Key key;
  require(make_key(path, key));
  if (size < 3 * sizeof(Word) || size > 4096) return 0;
  // The bytes are the chain's words: where it begins, and what stands there.
  const size_t count = size / sizeof(Word);
  const size_t first = data[1] % 8 == 0 ? mirror::kWords - count : kFirstEntry + data[0];
  memcpy(&words[first], data, count * sizeof(Word));
  words[mirror::kHeadsPlace] = mirror::kFirstPlace;
  words[mirror::kHeadsCount] = kHeads;
  words[mirror::kEnd] = static_cast<Word>(mirror::kWords);
  const size_t head = head_of(words.data(), key);
  words[head] = static_cast<Word>(data[1] % 16 == 0 ? mirror::kWords - data[0] % 64 : first);
  if (data[1] % 2 == 0 && first + 64 < mirror::kWords) {  // an entry of this path
    words[first + 1] = (words[first + 1] & ~0xFFU) | static_cast<Word>(key.bytes);
    memcpy(&words[first + mirror::kEntryHeader], key.words, key.count * sizeof(Word));
  }
  if (data[1] % 32 == 1) memcpy(&words[mirror::kHeadsPlace], data, 3 * sizeof(Word));
  const size_t room = data[size - 1];
  std::string buffer(room + 8, 'x');
  const int got = mirror::read(words.data(), path, buffer.data(), room);
  require(got >= -1 && got <= static_cast<int>(room));
  require(buffer.compare(room, 8, "xxxxxxxx") == 0);
  memset(&words[first], 0, count * sizeof(Word));
  if (first + 64 < mirror::kWords) memset(&words[first], 0, 64 * sizeof(Word));
  words[head] = 0;
  return 0;
}
