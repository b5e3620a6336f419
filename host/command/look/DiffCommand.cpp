#include <ostream>
#include <utility>

#include <nlohmann/json.hpp>

#include "host/command/look/LookCommands.h"
#include "host/compare/Comparison.h"
#include "host/compare/Holdings.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

const HeldApplication& heldBy(const Holdings& side, const std::string& identifier) {
    return side.applications.at(identifier);
}

Json sideJson(const HeldApplication& application) {
    return {{"version", application.version}, {"state", stateName(application.state)}};
}

Json onlyJson(const Holdings& side, const std::vector<std::string>& identifiers) {
    Json list = Json::array();
    for (const std::string& identifier : identifiers) {
        Json object = {{"identifier", identifier}};
        object.update(sideJson(heldBy(side, identifier)));
        list.push_back(std::move(object));
    }
    return list;
}

Json whatDiffers(const ApplicationDifference& difference) {
    Json what = Json::array();
    if (difference.inVersion) what.emplace_back("version");
    if (difference.inState) what.emplace_back("state");
    if (difference.inData) what.emplace_back("data");
    return what;
}

std::string comparisonJson(const Holdings& left, const Holdings& right,
                           const Comparison& comparison) {
    Json different = Json::array();
    for (const ApplicationDifference& each : comparison.different) {
        different.push_back({{"identifier", each.identifier},
                             {"what", whatDiffers(each)},
                             {"left", sideJson(heldBy(left, each.identifier))},
                             {"right", sideJson(heldBy(right, each.identifier))}});
    }
    Json order;
    if (comparison.isSameOrder) order = *comparison.isSameOrder ? "same" : "different";
    Json failed = Json::array();
    for (const UnreadableHolding& each : comparison.unreadable) {
        failed.push_back({{"what", each.what}, {"error", each.error}});
    }
    return indented({{"left", {{"path", left.path}, {"kind", kindName(left.kind)}}},
                     {"right", {{"path", right.path}, {"kind", kindName(right.kind)}}},
                     {"same", comparison.same()},
                     {"onlyLeft", onlyJson(left, comparison.onlyLeft)},
                     {"onlyRight", onlyJson(right, comparison.onlyRight)},
                     {"different", std::move(different)},
                     {"iconOrder", std::move(order)},
                     {"failed", std::move(failed)}});
}

void printOnly(const char* label, const Holdings& side, const std::vector<std::string>& identifiers,
               const Console& console) {
    for (const std::string& identifier : identifiers) {
        const HeldApplication& held = heldBy(side, identifier);
        console.out << label << identifier << " " << printable(held.version) << " ("
                    << stateName(held.state) << ")\n";
    }
}

void printDifference(const ApplicationDifference& difference, const Holdings& left,
                     const Holdings& right, const Console& console) {
    const HeldApplication& one = heldBy(left, difference.identifier);
    const HeldApplication& other = heldBy(right, difference.identifier);
    const std::string name = printable(difference.identifier);
    if (difference.inVersion) {
        console.out << "version     " << name << ": " << printable(one.version) << " | "
                    << printable(other.version) << '\n';
    }
    if (difference.inState) {
        console.out << "state       " << name << ": " << stateName(one.state) << " | "
                    << stateName(other.state) << '\n';
    }
    if (difference.inData) console.out << "data        " << name << '\n';
}

void printComparison(const Holdings& left, const Holdings& right, const Comparison& comparison,
                     const Console& console) {
    printOnly("only left   ", left, comparison.onlyLeft, console);
    printOnly("only right  ", right, comparison.onlyRight, console);
    for (const ApplicationDifference& each : comparison.different) {
        printDifference(each, left, right, console);
    }
    if (!comparison.isSameOrder.value_or(true)) console.out << "icon order\n";
    if (comparison.same()) console.out << "No difference.\n";
}

void sayKinds(const Holdings& left, const Holdings& right, const Console& console) {
    const auto described = [](const Holdings& side) {
        return side.path + " is a " + std::string(kindName(side.kind));
    };
    console.complain("left: " + described(left) + "; right: " + described(right));
}

Comparison compareShowingProgress(const Holdings& left, const Holdings& right,
                                  const Console& console) {
    LiveLine line(console);
    std::uint64_t read = 0;
    return compareHoldings(left, right, [&](const std::string& identifier, std::uint64_t bytes) {
        read += bytes;
        line.say("compared " + formatBytes(read) + "; now " + identifier);
    });
}

}  // namespace

int runDiff(const std::string& left, const std::string& right, bool asJson,
            const Console& console) {
    SystemPropertyLists codec;
    const Result<Holdings> one = readHoldings(left, codec);
    if (!one) return console.fail(one.error());
    const Result<Holdings> other = readHoldings(right, codec);
    if (!other) return console.fail(other.error());
    if (!asJson) sayKinds(*one, *other, console);
    const Comparison comparison = compareShowingProgress(*one, *other, console);
    if (asJson) {
        console.out << comparisonJson(*one, *other, comparison) << '\n';
    } else {
        printComparison(*one, *other, comparison, console);
    }
    for (const UnreadableHolding& each : comparison.unreadable) {
        console.complain(each.what + ": " + each.error);
    }
    const bool isSame = comparison.same() && comparison.unreadable.empty();
    return isSame ? kExitDone : kExitSomethingFailed;
}

}  // namespace appsync
