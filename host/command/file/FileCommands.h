#pragma once

// host/command/file: the commands for files of this machine; none needs a device. Called by
// host/command only.

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/PropertyListSerialization.h"

namespace appsync {

struct Console;

// PackageCommand.cpp, PackageCheckCommand.cpp (list and verify), PropertyListCommand.cpp

[[nodiscard]] int runPackageMake(const std::string& folder, const std::string& package, bool asJson,
                                 const Console& console);
[[nodiscard]] int runPackageShow(const std::string& package, bool asJson, const Console& console);
[[nodiscard]] int runPackageList(const std::string& folder, bool asJson, const Console& console);
[[nodiscard]] int runPackageVerify(const std::vector<std::string>& paths, bool asJson,
                                   const Console& console);
[[nodiscard]] int runPropertyListShow(const std::string& file, bool asJson, const Console& console);

struct ConvertArguments {
    std::string file;  // "-": standard input
    PropertyListFormat format = PropertyListFormat::Xml;
    /// "-", or nothing: standard output.
    std::optional<std::string> output;
    bool asJson = false;
};
[[nodiscard]] int runPropertyListConvert(const ConvertArguments& arguments, const Console& console);

// RecordingCommand.cpp, ReplayCommand.cpp: recordings of sessions.

/// Which lines are shown; what is nothing leaves none out.
struct ShowRecordingArguments {
    std::string file;
    std::optional<std::string> identifier;
    std::optional<std::string> service;
    std::optional<std::uint64_t> thread;
    /// In seconds since the session began.
    std::optional<double> from;
    std::optional<double> to;
    bool asJson = false;
};
[[nodiscard]] int runRecordingShow(const ShowRecordingArguments& arguments, const Console& console);

struct ReplayArguments {
    std::string file;
    /// The module with the plug-in; empty: the one that is built in.
    std::string plugIn;
    bool isStrict = false;
    bool asJson = false;
};
[[nodiscard]] int runReplay(const ReplayArguments& arguments, const Console& console);

}  // namespace appsync
