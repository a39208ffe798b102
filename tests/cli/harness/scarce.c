/* Preloaded into a program: memory that runs out on demand. The file that SCARCE_FILE names holds a 64-bit
 * number n, which a test may change at any time: above 0, the n-th allocation from now on fails, and only
 * that one. With SCARCE_PROGRAM only in a program of that name. */
#include <errno.h>
#include <fcntl.h>
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <unistd.h>

#define PUBLIC __attribute__((visibility("default")))

void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* block, size_t size);

static volatile int64_t* left;

static __attribute__((constructor)) void start(void) {
  const char* file = getenv("SCARCE_FILE");
  const char* program = getenv("SCARCE_PROGRAM");
  if (file == NULL || (program != NULL && strcmp(program, program_invocation_short_name) != 0)) return;
  int fd = open(file, O_RDWR | O_CLOEXEC);
  if (fd < 0) abort();
  void* map = mmap(NULL, sizeof *left, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  if (map == MAP_FAILED) abort();
  close(fd);
  left = map;
}

static int runs_out(void) {
  if (left == NULL || *left <= 0 || --*left > 0) return 0;
  errno = ENOMEM;
  return 1;
}

PUBLIC void* malloc(size_t size) {
  return runs_out() ? NULL : __libc_malloc(size);
}

PUBLIC void* calloc(size_t count, size_t size) {
  return runs_out() ? NULL : __libc_calloc(count, size);
}

PUBLIC void* realloc(void* block, size_t size) {
  return runs_out() ? NULL : __libc_realloc(block, size);
}

/* glibc's own calls realloc within the library, past this file. */
PUBLIC void* reallocarray(void* block, size_t count, size_t size) {
  size_t bytes;
  if (__builtin_mul_overflow(count, size, &bytes)) return NULL;
  return realloc(block, bytes);
}
