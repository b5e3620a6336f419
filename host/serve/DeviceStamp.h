#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <string>

namespace appsync {

/// One file as the system tells of it, without reading it. All 0 where there is none.
struct ServedFileStamp {
    dev_t device = 0;
    ino_t number = 0;
    off_t size = 0;
    std::int64_t changed = 0;  // nanoseconds; of the contents, and of who may read them

    bool operator==(const ServedFileStamp&) const = default;
};

/// What tells that a device has changed: its files as they stand, a few calls of the system.
struct DeviceStamp {
    ServedFileStamp database;
    ServedFileStamp journal;  // SQLite's write-ahead log; one that is empty counts as none
    ServedFileStamp root;
    ServedFileStamp log;

    /// Whether the same is to be read in the database and the root as with the other one.
    [[nodiscard]] bool holdsSameAs(const DeviceStamp& other) const;
    /// Whether it is so young that what is written next may have the same time: it says nothing of
    /// what comes.
    bool isYoung = false;
};

[[nodiscard]] DeviceStamp deviceStampOf(const std::string& device);

}  // namespace appsync
