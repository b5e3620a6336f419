#pragma once

namespace appsync::device_files {

/// The system calls that can be made to fail.
enum class Call {
    None,
    Fchown,
    Flock,
    Fsync,
    Fstat,
    Fstatat,
    Mkdirat,
    Openat,
    Openat2,
    Pread,
    Read,
    Renameat,
    Renameat2,
    Unlinkat,
    RemoveDirectory,  // unlinkat of a directory
    Utimensat,
    Write,
    CutOffWrite,  // the first writes half of it
};

inline constexpr int kForever = 1 << 30;

/// While it lives, a system call that this thread makes fails with an errno value: after `skipped`
/// calls that go through, `times` in a row. One at a time.
class FailingCall {
  public:
    FailingCall(Call call, int error, int times = kForever, int skipped = 0);
    FailingCall(const FailingCall&) = delete;
    FailingCall& operator=(const FailingCall&) = delete;
    ~FailingCall();

    /// How many calls have failed.
    [[nodiscard]] int failures() const;
};

}  // namespace appsync::device_files
