#include "memoryfile.h"

#include <sys/syscall.h>
#include <unistd.h>

#include <linux/memfd.h>

// The system call itself: the C libraries of older systems have no function for it.
int memoryFile(const char *label) {
  return static_cast<int>(syscall(SYS_memfd_create, label, MFD_CLOEXEC));
}
