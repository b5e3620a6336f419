#pragma once

#include <atomic>
#include <cstdint>
#include <string>
#include <vector>

#include "platform/Result.h"
#include "system/file/UniqueFd.h"

namespace appsync {

struct ErrorRecord;
struct FreedContainers;
struct InstallContext;
class RootedFileSystem;

/// Where the containers of versions lie that updates have replaced: beside the root of the device,
/// so that nothing on the device comes upon them. Which there are is for the database to say
/// (KeptTable.h), and for Reconciliation.h to make true. A container is moved whole, by one rename:
/// no crash leaves a part of one under its name. Callable on any thread.
class KeptBundles {
  public:
    KeptBundles(RootedFileSystem& files, std::string devicePath)
        : files_(files), devicePath_(std::move(devicePath)) {}

    /// Moves a container from those of bundles to the kept ones.
    Status keep(const std::string& container);

    /// Moves it back.
    Status bringBack(const std::string& container);

    /// Removes a kept container and everything in it; no link is followed. An empty name stands
    /// for none. What cannot be removed is left for the next session to clear.
    void remove(const std::string& container);

    /// The names of all that lies there, in no order. None where the directory is missing, and
    /// where something else stands in its place.
    [[nodiscard]] Result<std::vector<std::string>> names() const;

    /// Some were given up for the room that they took.
    void noteGivenUp() noexcept { gaveUp_ = true; }
    [[nodiscard]] bool gaveUp() const noexcept { return gaveUp_; }

  private:
    [[nodiscard]] std::string keptPath(const std::string& container) const;
    [[nodiscard]] Result<UniqueFd> directory() const;
    [[nodiscard]] Result<UniqueFd> madeDirectory() const;

    RootedFileSystem& files_;
    const std::string devicePath_;
    std::atomic<bool> gaveUp_{false};
};

/// What a change of the tables has freed goes, and what it keeps goes where that lies. After the
/// commit.
void putAway(const InstallContext& context, const FreedContainers& freed);

/// Gives up versions that are kept, the oldest first, until that many bytes are free on the
/// device's disk; none where they are. Only while the session's lock is held.
void makeRoomFor(const InstallContext& context, std::uint64_t bytes);

/// Whether the disk of a device is so full that not even its database can be written, while
/// something is kept that could be given up.
[[nodiscard]] bool isFullWithKept(const std::string& devicePath) noexcept;

/// For a device that is about to be opened, whose lock is held: on a disk where not even its
/// database can be written, gives up what is kept, what was put there first first, until that can
/// be. The records follow when the device is put in order. Never fails.
void giveUpKeptIfFull(const std::string& devicePath) noexcept;

/// After something found no space: gives up all that is kept. Whether it is worth another try,
/// because something was given up since the session began.
[[nodiscard]] bool makesRoomAfter(const InstallContext& context, const ErrorRecord& failure);

}  // namespace appsync
