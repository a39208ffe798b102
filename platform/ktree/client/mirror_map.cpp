#include "ktree/client/mirror_map.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

namespace ktree::client {
namespace {

// A file that cannot shrink: to read behind its end would kill the reader (SIGBUS of mmap(2)).
bool is_mirror(int fd) {
  struct stat info = {};
  const int seals = fcntl(fd, F_GET_SEALS);
  return seals >= 0 && (seals & F_SEAL_SHRINK) != 0 && fstat(fd, &info) == 0 &&
         info.st_size == mirror::kBytes;
}

}  // namespace

const mirror::Word* map_mirror(int fd) {
  if (!is_mirror(fd)) return nullptr;
  void* words = mmap(nullptr, mirror::kBytes, PROT_READ, MAP_SHARED, fd, 0);
  if (words == MAP_FAILED) return nullptr;
  madvise(words, mirror::kBytes, MADV_DONTDUMP);  // it holds secrets
  const auto* mirror = static_cast<const mirror::Word*>(words);
  if (mirror::load(mirror[mirror::kLayout]) == mirror::kThisLayout) return mirror;
  unmap_mirror(mirror);
  return nullptr;
}

void unmap_mirror(const mirror::Word* words) {
  if (words != nullptr) munmap(const_cast<mirror::Word*>(words), mirror::kBytes);
}

}  // namespace ktree::client
