// System calls with a test hook that fails one of them on request.
#include "syscalls.h"

#include <atomic>
#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace kxacl {
namespace {

std::atomic<bool> armed{false};
std::atomic<bool> fired{false};
std::atomic<sys_call> armed_call{sys_call::open};
std::atomic<long> calls_to_pass{0};
std::atomic<int> injected_errno{0};
std::atomic<void (*)(void *)> before_hook{nullptr};
std::atomic<void *> before_arg{nullptr};

// The slow path of injected(): only while a test has armed the hook.
bool fault_due(sys_call which) {
    if (armed_call.load(std::memory_order_relaxed) != which ||
        calls_to_pass.fetch_sub(1, std::memory_order_relaxed) != 0)
        return false;
    armed.store(false, std::memory_order_relaxed);
    fired.store(true, std::memory_order_relaxed);
    if (auto hook = before_hook.load(std::memory_order_relaxed)) {
        hook(before_arg.load(std::memory_order_relaxed));
        return false;
    }
    return true;
}

bool injected(sys_call which) {
    return armed.load(std::memory_order_relaxed) && fault_due(which);
}

// Fails the call: -1 with the armed errno (or null for getcwd).
int fail() {
    errno = injected_errno.load(std::memory_order_relaxed);
    return -1;
}

// A read or write armed with errno 0 moves half the bytes; one armed with
// an errno fails. Gives the count to pass on, or -1 to fail.
bool shortened(sys_call which, std::size_t *count) {
    if (!injected(which))
        return false;
    if (injected_errno.load(std::memory_order_relaxed) == 0) {
        *count /= 2;
        return false;
    }
    return true;
}

} // namespace

int sys_open(const char *path, int flags, mode_t mode) {
    return injected(sys_call::open) ? fail() : open(path, flags, mode);
}

ssize_t sys_read(int fd, void *buf, std::size_t count) {
    return shortened(sys_call::read, &count) ? fail() : read(fd, buf, count);
}

ssize_t sys_write(int fd, const void *buf, std::size_t count) {
    return shortened(sys_call::write, &count) ? fail() : write(fd, buf, count);
}

int sys_close(int fd) {
    int rc = close(fd);
    return injected(sys_call::close) ? fail() : rc;
}

int sys_stat(const char *path, struct stat *st) {
    return injected(sys_call::stat) ? fail() : stat(path, st);
}

int sys_lstat(const char *path, struct stat *st) {
    return injected(sys_call::lstat) ? fail() : lstat(path, st);
}

int sys_fstat(int fd, struct stat *st) {
    return injected(sys_call::fstat) ? fail() : fstat(fd, st);
}

int sys_fchown(int fd, uid_t uid, gid_t gid) {
    return injected(sys_call::fchown) ? fail() : fchown(fd, uid, gid);
}

int sys_fchmod(int fd, mode_t mode) {
    return injected(sys_call::fchmod) ? fail() : fchmod(fd, mode);
}

int sys_rename(const char *from, const char *to) {
    return injected(sys_call::rename) ? fail() : rename(from, to);
}

int sys_unlink(const char *path) {
    return injected(sys_call::unlink) ? fail() : unlink(path);
}

char *sys_getcwd(char *buf, std::size_t size) {
    if (injected(sys_call::getcwd)) {
        fail();
        return nullptr;
    }
    return getcwd(buf, size);
}

int sys_clear_nonblock(int fd) {
    if (injected(sys_call::fcntl))
        return fail();
    int flags = fcntl(fd, F_GETFL);
    return flags < 0 ? -1 : fcntl(fd, F_SETFL, flags & ~O_NONBLOCK);
}

namespace {

void arm(sys_call which, long nth, int err, void (*hook)(void *), void *arg) {
    armed.store(false, std::memory_order_relaxed);
    fired.store(false, std::memory_order_relaxed);
    if (nth < 0)
        return;
    armed_call.store(which, std::memory_order_relaxed);
    calls_to_pass.store(nth, std::memory_order_relaxed);
    injected_errno.store(err, std::memory_order_relaxed);
    before_hook.store(hook, std::memory_order_relaxed);
    before_arg.store(arg, std::memory_order_relaxed);
    armed.store(true, std::memory_order_relaxed);
}

} // namespace

void sys_fail_nth(sys_call which, long nth, int err) {
    arm(which, nth, err, nullptr, nullptr);
}

void sys_before_nth(sys_call which, long nth, void (*hook)(void *), void *arg) {
    arm(which, nth, 0, hook, arg);
}

bool sys_fault_fired() {
    return fired.load(std::memory_order_relaxed);
}

} // namespace kxacl
