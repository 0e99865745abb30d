// Preloaded into the programs under test: a system on which syncing does nothing, so that whoever
// doubts the power-loss checks sees them fail.
#define _GNU_SOURCE
#include <fcntl.h>
#include <unistd.h>

int fsync(int fd) { return fcntl(fd, F_GETFD) < 0 ? -1 : 0; }
int fdatasync(int fd) { return fsync(fd); }
int syncfs(int fd) { return fsync(fd); }
int sync_file_range(int fd, off64_t offset, off64_t count, unsigned flags) {
  (void)offset, (void)count, (void)flags;
  return fsync(fd);
}
void sync(void) {}
