#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <ostream>
#include <string>
#include <string_view>
#include <system_error>
#include <thread>

#include <nlohmann/json.hpp>

#include "host/Commands.h"
#include "host/Console.h"
#include "host/OpenDevice.h"
#include "host/Problem.h"
#include "host/Text.h"
#include "system/JsonLogFacility.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

constexpr std::chrono::milliseconds kFollowInterval{200};

// From the least to the most severe.
constexpr std::array kSeverity = {LogLevel::Debug, LogLevel::Info, LogLevel::Default,
                                  LogLevel::Error, LogLevel::Fault};

std::size_t severityOf(LogLevel level) {
    std::size_t rank = 0;
    while (rank < kSeverity.size() && kSeverity.at(rank) != level) ++rank;
    return rank;
}

std::size_t severityOf(std::string_view name) {
    std::size_t rank = 0;
    while (rank < kSeverity.size() && nameOf(kSeverity.at(rank)) != name) ++rank;
    return rank;
}

std::string textOf(const Json& line, const char* key) {
    const auto found = line.find(key);
    return found != line.end() && found->is_string() ? found->get<std::string>() : std::string();
}

bool isWanted(const Json& line, const LogArguments& arguments) {
    const auto category = line.find("category");
    if (arguments.category) {
        if (category == line.end() || !category->is_number_integer()) return false;
        if (category->get<std::int64_t>() != *arguments.category) return false;
    }
    return !arguments.level || severityOf(textOf(line, "level")) >= severityOf(*arguments.level);
}

void showLine(const std::string& text, const LogArguments& arguments, const Console& console) {
    const Json line = Json::parse(text, nullptr, false);
    if (!line.is_object() || !isWanted(line, arguments))
        return;  // cut off by a crash, for instance
    if (arguments.asJson) {
        console.out << text << '\n';
        return;
    }
    const auto category = line.find("category");
    const bool hasNumber = category != line.end() && category->is_number_integer();
    const std::string number = hasNumber ? category->dump() : "-";
    console.out << printable(textOf(line, "time")) << ' '
                << fitted(printable(textOf(line, "level")), 7) << ' '
                << fitted(printable(number), 2) << ' ' << printable(textOf(line, "message"))
                << '\n';
}

// Shows the whole lines that the file has from where the stream stands.
void showWhatIsThere(std::ifstream& file, std::string& begun, const LogArguments& arguments,
                     const Console& console) {
    std::string text;
    while (console.out.good() && std::getline(file, text)) {
        begun += text;
        if (file.eof()) break;  // the line is still being written
        showLine(begun, arguments, console);
        begun.clear();
    }
    file.clear();
    console.out.flush();
}

void follow(const std::string& path, const LogArguments& arguments, const Console& console) {
    std::ifstream file;
    std::string begun;
    std::error_code ignored;
    do {
        // A pipe in its place would be waited on.
        const bool isThere = file.is_open() || std::filesystem::is_regular_file(path, ignored);
        if (isThere && !file.is_open()) file.open(path, std::ios::binary);
        if (file.is_open()) showWhatIsThere(file, begun, arguments, console);
        if (arguments.follows) std::this_thread::sleep_for(kFollowInterval);
    } while (arguments.follows && console.out.good());
}

}  // namespace

int runLog(const LogArguments& arguments, const Console& console) {
    Result<std::unique_ptr<Device>> device = openDevice(arguments.device, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const std::string path = (*device)->logPath();
    device->reset();  // whoever watches the log has no use for the database
    follow(path, arguments, console);
    return kExitDone;
}

}  // namespace appsync
