#pragma once

#include <cstdint>

namespace appsync {

class AppRegistryObserver;
class SyncClient;
struct Platform;

/// The version of the interface between a loadable module of the plug-in and who loads it: this
/// table, and all of platform/ that crosses it. A loader refuses a module of another major version;
/// a higher minor version only adds to the end of the table. docs/module.md says what changes
/// which.
inline constexpr std::uint32_t kModuleMajorVersion = 1;
inline constexpr std::uint32_t kModuleMinorVersion = 0;

/// A client, and its maker's hold on it. Without a client there was no memory for one.
struct PlugInClient {
    SyncClient* client = nullptr;
    /// The same client as the registry knows it. A host that lets it go while the registry may be
    /// calling it removes this from its registry first: else the client's last moment could come on
    /// the registry's thread.
    AppRegistryObserver* observer = nullptr;
    void* hold = nullptr;  // the module's own
};

/// What a module of the plug-in is used by. The table lasts as long as the module is loaded; both
/// functions may be called on any thread, and never throw.
struct PlugInTable {
    // These three stand here in every version of the interface.
    std::uint32_t majorVersion;
    std::uint32_t minorVersion;
    /// The version of the plug-in itself, for people.
    const char* plugInVersion;

    // Since version 1.0.

    /// Makes a client, as `AppsClient::create` does. The services of the platform must outlive it,
    /// the work that it has queued included; the struct itself is copied.
    PlugInClient (*makeClient)(const Platform& platform) noexcept;
    /// Lets the client go; it goes with the last work that it has left on the queues. So a module
    /// is unloaded only when the queues, and whoever else was handed anything of the client's, are
    /// gone.
    void (*destroyClient)(PlugInClient made) noexcept;
};

/// The name of the one function that a module exports, for who looks it up.
inline constexpr const char* kPlugInTableSymbol = "appsyncPlugInTable";

}  // namespace appsync

/// The plug-in that is linked in here; the one function that a module of it exports. Never null.
extern "C" const appsync::PlugInTable* appsyncPlugInTable() noexcept;
