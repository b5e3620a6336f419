#include "host/module/PlugInModule.h"

#include <dlfcn.h>

#include <exception>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>

#include "host/console/Problem.h"
#include "host/module/ModuleFile.h"
#include "host/module/Trial.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

constexpr const char* kNameABuild = "name a build of appsync-plugin.so";

std::string interfaceText(std::uint32_t major, std::uint32_t minor) {
    return std::to_string(major) + "." + std::to_string(minor);
}

ErrorRecord cannotLoad(const std::string& path, const std::string& reason) {
    return unusable(displayPath(path) + " cannot be loaded: " + reason, kNameABuild);
}

ErrorRecord threwWhileLoaded(const std::string& path, const std::string& what) {
    return unusable(displayPath(path) + " threw an exception while it was loaded: " + what,
                    "name a build that can be loaded");
}

// Gives what `action` does; an error where it throws.
template <typename Action>
auto guarded(const std::string& path, const Action& action) -> Result<decltype(action())> {
    try {
        return action();
    } catch (const std::exception& thrown) {
        return threwWhileLoaded(path, thrown.what());
    } catch (...) {
        return threwWhileLoaded(path, "it does not say why");
    }
}

std::string timeText(std::chrono::milliseconds time) {
    return time < std::chrono::seconds(1) ? std::to_string(time.count()) + " ms"
                                          : std::to_string(time.count() / 1000) + " s";
}

std::string lastLoadError() {
    const char* const text = ::dlerror();
    return text != nullptr ? text : "the system does not say why";
}

// Without a slash the system would look for it elsewhere.
std::string absolutePath(const std::string& path) {
    std::error_code ignored;
    const std::filesystem::path absolute = std::filesystem::absolute(path, ignored);
    return absolute.empty() ? path : absolute.string();
}

Status checkTable(const PlugInTable* table, const std::string& path) {
    const std::string shown = displayPath(path);
    if (table == nullptr) return unusable(shown + " gives no table", kNameABuild);
    if (table->majorVersion != kModuleMajorVersion) {
        return unusable(shown + " has version " +
                            interfaceText(table->majorVersion, table->minorVersion) +
                            " of the module interface, and this command wants " +
                            std::to_string(kModuleMajorVersion) + ".x",
                        "name a build with that version");
    }
    if (table->makeClient == nullptr || table->destroyClient == nullptr) {
        return unusable(shown + " lacks a function in its table", kNameABuild);
    }
    return {};
}

}  // namespace

void PlugInModule::Unload::operator()(void* handle) const noexcept { ::dlclose(handle); }

Result<PlugInModule::Handle> PlugInModule::loadFile(const std::string& path) {
    // It is declared as if it never threw; what runs while a module is loaded may. So the compiler
    // is not to know whom it calls.
    static void* (*const volatile load)(const char*, int) = ::dlopen;
    const std::string file = absolutePath(path);
    Result<void*> loaded =
        guarded(path, [&file] { return load(file.c_str(), RTLD_NOW | RTLD_LOCAL); });
    if (!loaded) return loaded.error();
    if (*loaded == nullptr) return cannotLoad(path, lastLoadError());
    return Handle(*loaded);
}

Result<const PlugInTable*> PlugInModule::tableOf(void* handle, const std::string& path) {
    // Not noexcept, whatever the header says: a foreign module may throw.
    using TableFunction = const PlugInTable* (*)();
    const auto function = reinterpret_cast<TableFunction>(::dlsym(handle, kPlugInTableSymbol));
    if (function == nullptr) {
        return unusable(displayPath(path) + " has no " + kPlugInTableSymbol +
                            ", so it is no build of the plug-in",
                        kNameABuild);
    }
    Result<const PlugInTable*> table = guarded(path, function);
    if (!table) return table.error();
    const Status usable = checkTable(*table, path);
    if (!usable) return usable.error();
    return table;
}

Status PlugInModule::tryFile(const std::string& path, std::chrono::milliseconds limit) {
    const auto load = [&path]() -> std::string {
        const Result<PlugInModule> loaded = openHere(path);
        return loaded ? "" : loaded.error().description();
    };
    const Result<TrialOutcome> trial = tryInAnotherProcess(load, limit);
    if (!trial) return unusable(trial.error());
    if (trial->isOverdue) {
        return unusable(
            displayPath(path) + " hangs: loading it had not ended after " + timeText(limit),
            kNameABuild);
    }
    if (!trial->answer) {
        return unusable(displayPath(path) + " ends the process that loads it, with " + trial->end,
                        kNameABuild);
    }
    if (trial->answer->empty()) return {};
    return ErrorRecord::make(kCommandErrorDomain, kExitUnusable, *trial->answer);
}

Result<PlugInModule> PlugInModule::open(const std::string& path, std::chrono::milliseconds limit) {
    if (path.empty()) return PlugInModule();
    const Status whole = checkModuleFile(path);
    if (!whole) return whole.error();
    const Status tried = tryFile(path, limit);
    if (!tried) return tried.error();
    return openHere(path);
}

Result<PlugInModule> PlugInModule::openHere(const std::string& path) {
    Result<Handle> handle = loadFile(path);
    if (!handle) return handle.error();
    const Result<const PlugInTable*> table = tableOf(handle->get(), path);
    if (!table) return table.error();
    return PlugInModule(*std::move(handle), **table);
}

std::string moduleInterfaceVersion() {
    return interfaceText(kModuleMajorVersion, kModuleMinorVersion);
}

}  // namespace appsync
