// The system calls of the ACL file paths. Each goes through these wrappers
// so that tests can make one call of a kind fail with a chosen errno, the
// way mem_fail_after makes allocations fail, and check that every failure
// is reported, cleaned up and leaves the files as they were. Unarmed, a
// wrapper costs one relaxed atomic load more than the call itself.
#ifndef KXACL_SYSCALLS_H
#define KXACL_SYSCALLS_H

#include <cstddef>
#include <sys/stat.h>
#include <sys/types.h>

namespace kxacl {

int sys_open(const char *path, int flags, mode_t mode = 0);
ssize_t sys_read(int fd, void *buf, std::size_t count);
ssize_t sys_write(int fd, const void *buf, std::size_t count);
// The descriptor is closed even when the close is made to fail, as Linux
// does for a close that reports an error.
int sys_close(int fd);
int sys_stat(const char *path, struct stat *st);
int sys_lstat(const char *path, struct stat *st);
int sys_fstat(int fd, struct stat *st);
int sys_fchown(int fd, uid_t uid, gid_t gid);
int sys_fchmod(int fd, mode_t mode);
int sys_rename(const char *from, const char *to);
int sys_unlink(const char *path);
char *sys_getcwd(char *buf, std::size_t size);
// Clears O_NONBLOCK on a descriptor that was opened with it so that the
// open could not hang on a FIFO, once it is known to be a regular file.
int sys_clear_nonblock(int fd);

enum class sys_call {
    open,
    read,
    write,
    close,
    stat,
    lstat,
    fstat,
    fchown,
    fchmod,
    rename,
    unlink,
    getcwd,
    fcntl
};

// Fault injection for tests: the call of kind `which` numbered nth (0 is the
// next one) fails with errno err, after which the hook disarms itself. With
// err 0 a read or write is made short instead: it moves half the bytes asked
// for. A negative nth disarms the hook.
void sys_fail_nth(sys_call which, long nth, int err);
// Race injection for tests: just before the call of kind `which` numbered
// nth, hook(arg) runs (and may rename, replace or remove files), then the
// call goes on as usual; the hook disarms itself. Shares the one slot of
// sys_fail_nth: arming either disarms the other.
void sys_before_nth(sys_call which, long nth, void (*hook)(void *), void *arg);
// True when the fault or hook armed last has happened.
bool sys_fault_fired();

} // namespace kxacl

#endif
