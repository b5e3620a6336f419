#include <filesystem>
#include <ostream>
#include <system_error>
#include <utility>

#include <nlohmann/json.hpp>

#include "host/command/file/FileCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/plan/LibraryReader.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;

// What became of some packages: which are good, and what is wrong with the others.
struct CheckedPackages {
    std::vector<LibraryPackage> good;
    std::vector<LibraryFault> faults;

    void note(const std::string& name, const Result<LibraryPackage>& package) {
        if (package) {
            good.push_back(*package);
            good.back().file = name;
        } else {
            faults.push_back({name, package.error().description()});
        }
    }
};

std::string checkedJson(const CheckedPackages& checked) {
    Json packages = Json::array();
    for (const LibraryPackage& each : checked.good) {
        packages.push_back({{"file", each.file},
                            {"identifier", each.identifier},
                            {"version", each.version},
                            {"name", each.name},
                            {"bytes", each.bytes}});
    }
    Json failed = Json::array();
    for (const LibraryFault& each : checked.faults) {
        failed.push_back({{"file", each.fileName}, {"error", each.error}});
    }
    return indented({{"packages", std::move(packages)}, {"failed", std::move(failed)}});
}

int finishCheck(const CheckedPackages& checked, const Console& console) {
    for (const LibraryFault& each : checked.faults) {
        const bool isNamed = each.error.find(each.fileName) != std::string::npos;
        console.complain(isNamed ? each.error : each.fileName + ": " + each.error);
    }
    return checked.faults.empty() ? kExitDone : kExitSomethingFailed;
}

std::string packagesTable(const std::vector<LibraryPackage>& packages, const Console& console) {
    if (packages.empty()) return "No packages.\n";
    Table table({"FILE", "IDENTIFIER", "VERSION", "NAME", "SIZE"});
    for (const std::size_t column : {0U, 1U}) table.keepEndsOf(column);
    table.spare({3, 4, 0});
    for (const LibraryPackage& each : packages) {
        table.add({each.file, each.identifier, each.version.empty() ? "-" : each.version, each.name,
                   formatBytes(each.bytes)});
    }
    return table.textFor(console);
}

// One run of `package verify`.
class PackageCheck {
  public:
    explicit PackageCheck(const Console& console) : line_(console) {}

    CheckedPackages run(const std::vector<std::string>& paths) {
        for (const std::string& path : paths) {
            std::error_code code;
            if (fs::is_directory(path, code)) {
                checkFolder(path);
            } else {
                check(path);
            }
        }
        line_.clear();
        return std::move(checked_);
    }

  private:
    void checkFolder(const std::string& folder) {
        const Result<std::vector<std::string>> names = packageNamesIn(folder);
        if (!names) {
            checked_.faults.push_back({folder, names.error().description()});
            return;
        }
        if (names->empty()) {
            checked_.faults.push_back(
                {folder, "there is no package in " + folder + ": name a folder of packages"});
        }
        for (const std::string& name : *names) check((fs::path(folder) / name).native());
        const auto order = readIconOrder(folder, codec_);
        if (order) return;
        const fs::path file = fs::path(folder) / std::string(kIconOrderFile);
        checked_.faults.push_back({file.native(), order.error().description()});
    }

    void check(const std::string& file) {
        const auto progress = [&](std::uint64_t bytes) {
            read_ += bytes;
            line_.say("checked " + counted(checked_.good.size(), "package") + ", " +
                      formatBytes(read_) + "; now " + fs::path(file).filename().native());
        };
        checked_.note(file, readWholePackage(file, codec_, progress));
    }

    LiveLine line_;
    SystemPropertyLists codec_;
    CheckedPackages checked_;
    std::uint64_t read_ = 0;
};

std::string verdictText(const CheckedPackages& checked) {
    const std::size_t good = checked.good.size();
    return counted(good, "package") + (good == 1 ? " is good\n" : " are good\n");
}

}  // namespace

int runPackageList(const std::string& folder, bool asJson, const Console& console) {
    const Result<std::vector<std::string>> names = packageNamesIn(folder);
    if (!names) return console.fail(names.error());
    SystemPropertyLists codec;
    CheckedPackages checked;
    for (const std::string& name : *names) {
        checked.note(name, readPackage((fs::path(folder) / name).native(), codec));
    }
    console.out << (asJson ? checkedJson(checked) + "\n" : packagesTable(checked.good, console));
    return finishCheck(checked, console);
}

int runPackageVerify(const std::vector<std::string>& paths, bool asJson, const Console& console) {
    const CheckedPackages checked = PackageCheck(console).run(paths);
    console.out << (asJson ? checkedJson(checked) + "\n" : verdictText(checked));
    return finishCheck(checked, console);
}

}  // namespace appsync
