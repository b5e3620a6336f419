#include "host/command/shell/ShellCommands.h"

#include <filesystem>
#include <ostream>
#include <set>
#include <span>
#include <system_error>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/shell/Completion.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "platform/Bytes.h"

namespace appsync {
namespace {

std::vector<std::string> identifiersOn(const std::string& path) {
    if (path.empty() || !looksLikeDevice(path)) return {};
    const Result<std::unique_ptr<Device>> device = openDevice(path, DeviceAccess::Look);
    if (!device) return {};
    const Result<std::vector<ApplicationRecord>> records = (*device)->applications();
    if (!records) return {};
    std::set<std::string> identifiers;
    for (const ApplicationRecord& each : *records) identifiers.insert(each.identifier);
    return {identifiers.begin(), identifiers.end()};
}

Status writePage(const std::string& folder, const ManualPage& page) {
    const auto* const bytes = reinterpret_cast<const std::uint8_t*>(page.text.data());
    return writeHostFile(folder + "/" + page.file, std::span(bytes, page.text.size()));
}

}  // namespace

int runComplete(const CommandEntry& program, std::vector<std::string> words,
                const Console& console) {
    if (!words.empty() && words.front() == "--") words.erase(words.begin());
    console.out << completionLines(completionsOf(program, words, identifiersOn));
    return kExitDone;
}

int runCompletion(const std::string& shell, const Console& console) {
    console.out << completionScript(shell);
    return kExitDone;
}

int runManual(const std::string& folder, const std::vector<ManualPage>& pages, bool asJson,
              const Console& console) {
    std::error_code failed;
    std::filesystem::create_directories(folder, failed);
    if (failed) {
        return console.fail(failure("cannot make " + folder + ": " + failed.message(),
                                    "name a folder in a directory that can be written"));
    }
    nlohmann::ordered_json names = nlohmann::ordered_json::array();
    for (const ManualPage& each : pages) {
        const Status written = writePage(folder, each);
        if (!written) return console.fail(written.error());
        names.push_back(each.file);
    }
    if (asJson) {
        console.out << indented({{"folder", folder}, {"pages", std::move(names)}}) << '\n';
    } else {
        console.out << printable(folder) << " has " << counted(pages.size(), "page") << ": man "
                    << printable(folder) << "/" << pages.front().file << '\n';
    }
    return kExitDone;
}

}  // namespace appsync
