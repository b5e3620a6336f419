#include "tests/system/FailingCalls.h"

#include <array>
#include <cerrno>
#include <cstdarg>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace appsync::device_files {

namespace {

struct Plan {
    Call call = Call::None;
    int error = 0;
    int times = 0;
    int skipped = 0;
    int failures = 0;
};
thread_local Plan plan;

bool fails(Call call) {
    if (plan.call != call) return false;
    if (plan.skipped > 0) {
        --plan.skipped;
        return false;
    }
    if (plan.failures >= plan.times) return false;
    ++plan.failures;
    errno = plan.error;
    return true;
}

}  // namespace

FailingCall::FailingCall(Call call, int error, int times, int skipped) {
    plan = {call, error, times, skipped, 0};
}

FailingCall::~FailingCall() { plan = {}; }

int FailingCall::failures() const { return plan.failures; }

}  // namespace appsync::device_files

// The linker sends every call of `name` to __wrap_name, and of __real_name to the system.
using appsync::device_files::Call;
using appsync::device_files::fails;
using appsync::device_files::plan;

extern "C" {

int __real_fchown(int descriptor, uid_t user, gid_t group);
int __wrap_fchown(int descriptor, uid_t user, gid_t group) {
    return fails(Call::Fchown) ? -1 : __real_fchown(descriptor, user, group);
}

int __real_flock(int descriptor, int operation);
int __wrap_flock(int descriptor, int operation) {
    return fails(Call::Flock) ? -1 : __real_flock(descriptor, operation);
}

int __real_fsync(int descriptor);
int __wrap_fsync(int descriptor) { return fails(Call::Fsync) ? -1 : __real_fsync(descriptor); }

int __real_fstat(int descriptor, struct stat* status);
int __wrap_fstat(int descriptor, struct stat* status) {
    return fails(Call::Fstat) ? -1 : __real_fstat(descriptor, status);
}

int __real_fstatat(int directory, const char* path, struct stat* status, int flags);
int __wrap_fstatat(int directory, const char* path, struct stat* status, int flags) {
    return fails(Call::Fstatat) ? -1 : __real_fstatat(directory, path, status, flags);
}

int __real_mkdirat(int directory, const char* path, mode_t mode);
int __wrap_mkdirat(int directory, const char* path, mode_t mode) {
    return fails(Call::Mkdirat) ? -1 : __real_mkdirat(directory, path, mode);
}

int __real_openat(int directory, const char* path, int flags, ...);
int __wrap_openat(int directory, const char* path, int flags, ...) {
    mode_t mode = 0;
    if ((flags & O_CREAT) != 0) {
        va_list arguments;
        va_start(arguments, flags);
        mode = va_arg(arguments, mode_t);
        va_end(arguments);
    }
    return fails(Call::Openat) ? -1 : __real_openat(directory, path, flags, mode);
}

ssize_t __real_pread(int descriptor, void* target, size_t size, off_t offset);
ssize_t __wrap_pread(int descriptor, void* target, size_t size, off_t offset) {
    return fails(Call::Pread) ? -1 : __real_pread(descriptor, target, size, offset);
}

ssize_t __real_read(int descriptor, void* target, size_t size);
ssize_t __wrap_read(int descriptor, void* target, size_t size) {
    return fails(Call::Read) ? -1 : __real_read(descriptor, target, size);
}

int __real_renameat(int from, const char* fromPath, int to, const char* toPath);
int __wrap_renameat(int from, const char* fromPath, int to, const char* toPath) {
    return fails(Call::Renameat) ? -1 : __real_renameat(from, fromPath, to, toPath);
}

int __real_renameat2(int from, const char* fromPath, int to, const char* toPath, unsigned flags);
int __wrap_renameat2(int from, const char* fromPath, int to, const char* toPath, unsigned flags) {
    return fails(Call::Renameat2) ? -1 : __real_renameat2(from, fromPath, to, toPath, flags);
}

long __real_syscall(long number, ...);
long __wrap_syscall(long number, ...) {
    std::array<long, 4> values{};  // as many as openat2 takes, and the waiting of the library
    va_list arguments;
    va_start(arguments, number);
    for (long& value : values) value = va_arg(arguments, long);
    va_end(arguments);
    if (number == SYS_openat2 && fails(Call::Openat2)) return -1;
    return __real_syscall(number, values[0], values[1], values[2], values[3]);
}

int __real_unlinkat(int directory, const char* path, int flags);
int __wrap_unlinkat(int directory, const char* path, int flags) {
    const Call call = flags == AT_REMOVEDIR ? Call::RemoveDirectory : Call::Unlinkat;
    return fails(call) ? -1 : __real_unlinkat(directory, path, flags);
}

int __real_utimensat(int directory, const char* path, const timespec* times, int flags);
int __wrap_utimensat(int directory, const char* path, const timespec* times, int flags) {
    return fails(Call::Utimensat) ? -1 : __real_utimensat(directory, path, times, flags);
}

ssize_t __real_write(int descriptor, const void* source, size_t size);
ssize_t __wrap_write(int descriptor, const void* source, size_t size) {
    if (fails(Call::CutOffWrite)) {
        return plan.failures == 1 ? __real_write(descriptor, source, size / 2) : -1;
    }
    return fails(Call::Write) ? -1 : __real_write(descriptor, source, size);
}

}  // extern "C"
