#pragma once

#include <filesystem>

#include "platform/AppRegistry.h"
#include "platform/SyncHost.h"
#include "platform/absent/AbsentServices.h"
#include "system/file/RootedFileSystem.h"
#include "system/property_list/PropertyListCodec.h"
#include "system/threads/SystemWorkQueues.h"

namespace port {

/// A registry in plain files: each bundle stands in a container of its own, and a book says which
/// containers there are. The book is replaced in one step, so each change is there or not.
///
/// A package of this device is a property list, which becomes the Info.plist of its bundle.
std::unique_ptr<appsync::AppRegistry> makeRegistry(appsync::RootedFileSystem& files,
                                                   appsync::PropertyListSerialization& codec);

/// The daemon that the plug-in is part of.
class Host : public appsync::SyncHost {
  public:
    std::string mainBundleIdentifier() const override { return "com.example.daemon"; }
    std::string pluginBundleIdentifier() const override { return "com.example.appsync"; }
    bool isRecoverableError(const appsync::ErrorRecord& /*error*/) const override { return false; }
};

/// A device in a directory of this machine, which one process at a time may open.
class Device {
  public:
    /// Opens it, or begins one where nothing is. Throws std::bad_variant_access where it cannot.
    explicit Device(const std::string& directory) : files_(openFiles(directory)) {}

    appsync::Platform platform() {
        return absent_.completed(host_, *registry_, queues_, *files_, codec_);
    }

  private:
    static std::unique_ptr<appsync::RootedFileSystem> openFiles(const std::string& directory) {
        std::filesystem::create_directories(directory);
        auto files = *appsync::RootedFileSystem::open(directory);
        // What earlier processes have left.
        files->removeContents("/tmp", [](const std::string&) { return true; }).ignore();
        files->removeStaleTemporaries("/var").ignore();
        return files;
    }

    Host host_;
    appsync::AbsentServices absent_;
    appsync::SystemPropertyLists codec_;
    std::unique_ptr<appsync::RootedFileSystem> files_;
    std::unique_ptr<appsync::AppRegistry> registry_ = makeRegistry(*files_, codec_);
    appsync::SystemWorkQueues queues_;  // go first: what runs on them uses all the others
};

}  // namespace port
