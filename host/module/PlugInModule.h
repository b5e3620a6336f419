#pragma once

// host/module: the plug-in as a file that is loaded (docs/module.md): PlugInModule.h loads it,
// ModuleFile.h looks at it before anything of it runs, Trial.h has a process of its own load it
// first. Includes console, file, platform/ and system/. Called by session and by the commands that
// hold one.

#include <chrono>
#include <memory>
#include <string>
#include <utility>

#include "platform/PlugInTable.h"
#include "platform/Result.h"

namespace appsync {

/// A build of the plug-in: the one that is built in, or a module that was loaded, which is unloaded
/// with this object. That must outlive everything that was made with the module or handed out by
/// it: clients, what they answered, and the platform that they were given.
class PlugInModule {
  public:
    /// The plug-in that is built in.
    PlugInModule() : table_(appsyncPlugInTable()) {}

    /// Loads the module in that file of this machine; the built-in plug-in where `path` is empty.
    /// What cannot be used is refused as such: what has no right name, is no shared object, is of
    /// another machine or cut short, cannot be loaded, throws or ends the process meanwhile, has no
    /// table, or one of another major version. A copy of this process finds that out, so that
    /// nothing of a module that is refused was ever in this one; so is one that hangs: the copy has
    /// `limit` for all of it. What a module does while it is loaded is its own otherwise: it does
    /// it twice, with this process's rights.
    [[nodiscard]] static Result<PlugInModule> open(
        const std::string& path, std::chrono::milliseconds limit = std::chrono::seconds(10));

    [[nodiscard]] const PlugInTable& table() const { return *table_; }

  private:
    struct Unload {
        void operator()(void* handle) const noexcept;
    };
    using Handle = std::unique_ptr<void, Unload>;

    PlugInModule(Handle handle, const PlugInTable& table)
        : handle_(std::move(handle)), table_(&table) {}

    [[nodiscard]] static Status tryFile(const std::string& path, std::chrono::milliseconds limit);
    [[nodiscard]] static Result<PlugInModule> openHere(const std::string& path);
    [[nodiscard]] static Result<Handle> loadFile(const std::string& path);
    [[nodiscard]] static Result<const PlugInTable*> tableOf(void* handle, const std::string& path);

    Handle handle_;
    const PlugInTable* table_;
};

/// The version of the modules' interface that this command speaks: "1.0".
[[nodiscard]] std::string moduleInterfaceVersion();

}  // namespace appsync
