// A mirror whose words are anything at all, as a reader may find it in the middle of a change: a read ends,
// stays inside, and gives no more than was asked for.
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "ktree/mirror.h"
#include "require.h"

using namespace ktree;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const std::string path = "/iscsi/initiator/id:1/share";
  // Exactly as long as it is: a read outside is seen.
  static std::vector<mirror::Word> words(mirror::kWords);
  mirror::Key key;
  require(make_key(path, key));
  if (size < 2 || size > 4096) return 0;
  // The bytes are the chain's words: where it begins, and what stands there.
  const size_t first = mirror::kFirstEntry + data[0];
  const size_t count = size / sizeof(mirror::Word);
  words[key.head] = data[1] % 8 == 0 ? mirror::kWords - 1 - data[0] % 64 : first;
  memcpy(&words[first], data, count * sizeof(mirror::Word));
  if (data[1] % 2 == 0) {  // an entry of this path
    words[first + 2] = path.size();
    memcpy(&words[first + mirror::kEntryHeader], key.words, key.count * sizeof(mirror::Word));
  }
  const size_t room = data[size - 1];
  std::string buffer(room + 8, 'x');
  const int got = mirror::read(words.data(), path, buffer.data(), room);
  require(got >= -1 && got <= static_cast<int>(room));
  require(buffer.compare(room, 8, "xxxxxxxx") == 0);
  memset(&words[first], 0, (count + 64) * sizeof(mirror::Word));
  words[key.head] = 0;
  return 0;
}
