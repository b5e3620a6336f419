#include "contract/KitReport.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <utility>

#include "contract/OptionalServices.h"

namespace appsync {
namespace {

constexpr std::size_t kLineLength = 100;
constexpr std::size_t kSightsShown = 3;

std::string count(std::size_t number, const std::string& what) {
    return std::to_string(number) + " " + what + (number == 1 ? "" : "s");
}

/// The text in lines that begin with the indent.
std::string indented(std::string_view text, const std::string& indent) {
    std::string lines;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        if (end > 0) lines += indent + std::string(text.substr(0, end)) + "\n";
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return lines;
}

/// The text, broken between words into lines that begin with the indent.
std::string wrapped(std::string_view text, const std::string& indent) {
    std::string lines;
    while (text.size() > kLineLength - indent.size()) {
        std::size_t end = text.rfind(' ', kLineLength - indent.size());
        if (end == std::string_view::npos) end = std::min(text.find(' '), text.size());
        lines += indent + std::string(text.substr(0, end)) + "\n";
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return text.empty() ? lines : lines + indent + std::string(text) + "\n";
}

std::string textOfBroken(const ContractSentence& sentence,
                         const std::vector<PortReport::Sight>& sights) {
    std::string text =
        sentence.header.empty()
            ? "\nbroken before any sentence was looked at, or after the last\n"
            : "\nbroken: " + sentence.header + "\n" + wrapped('"' + sentence.text + '"', "    ");
    for (std::size_t i = 0; i < std::min(sights.size(), kSightsShown); ++i) {
        text += "  seen in " + sights[i].test + ":\n" + indented(sights[i].seen, "    ");
    }
    if (sights.size() > kSightsShown) {
        text += "  and " + count(sights.size() - kSightsShown, "time") + " more\n";
    }
    return text;
}

/// How many bytes the character has that the text begins with; 0 where it is none of UTF-8, such as
/// a process prints that dies.
std::size_t characterLength(std::string_view text) {
    const auto first = static_cast<unsigned char>(text.front());
    if (first < 0x80) return 1;
    if (first < 0xc2 || first > 0xf4) return 0;
    const std::size_t length = first < 0xe0 ? 2 : first < 0xf0 ? 3 : 4;
    if (text.size() < length) return 0;
    const auto second = static_cast<unsigned char>(text[1]);
    const bool isTooLong = (first == 0xe0 && second < 0xa0) || (first == 0xf0 && second < 0x90);
    const bool isBeyond = (first == 0xed && second > 0x9f) || (first == 0xf4 && second > 0x8f);
    const std::string_view rest = text.substr(1, length - 1);
    const bool goesOn = std::all_of(rest.begin(), rest.end(), [](char byte) {
        return (static_cast<unsigned char>(byte) & 0xc0U) == 0x80U;
    });
    return goesOn && !isTooLong && !isBeyond ? length : 0;
}

/// The text, with a mark in the place of each byte that is no part of a character.
std::string readable(std::string_view text) {
    std::string characters;
    while (!text.empty()) {
        const std::size_t length = characterLength(text);
        characters += length == 0 ? "\xef\xbf\xbd" : std::string(text.substr(0, length));
        text.remove_prefix(std::max<std::size_t>(length, 1));
    }
    return characters;
}

std::string jsonString(std::string_view text) {
    std::string json = "\"";
    for (const char character : readable(text)) {
        if (character == '"' || character == '\\') {
            json += '\\';
            json += character;
        } else if (static_cast<unsigned char>(character) < 0x20) {
            std::array<char, 8> code{};
            std::snprintf(code.data(), code.size(), "\\u%04x", static_cast<unsigned>(character));
            json += code.data();
        } else {
            json += character;
        }
    }
    return json + '"';
}

template <typename Range, typename Render>
std::string jsonArray(const Range& range, Render render) {
    std::string json;
    for (const auto& each : range) json += (json.empty() ? "" : ", ") + render(each);
    return "[" + json + "]";
}

std::string jsonFields(const ContractSentence& sentence) {
    return "\"header\": " + jsonString(sentence.header) +
           ", \"sentence\": " + jsonString(sentence.text);
}

std::string jsonOfSight(const PortReport::Sight& sight) {
    return "{\"test\": " + jsonString(sight.test) + ", \"what\": " + jsonString(sight.seen) + "}";
}

std::string jsonOfPort(const PortReport& report) {
    std::string json = "{\"port\": " + jsonString(report.port);
    json += ", \"tests\": " + std::to_string(report.tests);
    json += ", \"kept\": " + jsonArray(report.kept, [](const ContractSentence& sentence) {
                return "{" + jsonFields(sentence) + "}";
            });
    json += ", \"broken\": " + jsonArray(report.broken, [](const auto& broken) {
                return "{" + jsonFields(broken.first) +
                       ", \"seen\": " + jsonArray(broken.second, jsonOfSight) + "}";
            });
    json += ", \"skipped\": " + jsonArray(report.skipped, [](const auto& skipped) {
                return "{\"test\": " + jsonString(skipped.first) +
                       ", \"why\": " + jsonString(skipped.second) + "}";
            });
    json += ", \"absent\": " + jsonArray(report.absent, [](OptionalService service) {
                return "{\"service\": " + jsonString(nameOf(service)) +
                       ", \"meaning\": " + jsonString(meaningOfAbsence(service)) + "}";
            });
    return json + ", \"not_made\": " + jsonArray(report.notMade, jsonString) + "}";
}

}  // namespace

PortReport reportOf(const ContractPort& port, const std::vector<TestOutcome>& outcomes) {
    PortReport report;
    report.port = port.name;
    report.absent = port.absent;
    if (!port.makeSystem) report.notMade.emplace_back("system");
    if (!port.makeDevice) report.notMade.emplace_back("device");
    for (const TestOutcome& outcome : outcomes) {
        if (outcome.port != port.name) continue;
        ++report.tests;
        report.kept.insert(outcome.lookedAt.begin(), outcome.lookedAt.end());
        if (!outcome.skipped.empty()) report.skipped[outcome.test] = outcome.skipped;
        for (const BrokenSentence& broken : outcome.broken) {
            report.broken[broken.sentence].push_back({outcome.test, broken.seen});
        }
    }
    for (const auto& [sentence, sights] : report.broken) report.kept.erase(sentence);
    return report;
}

std::string textOf(const PortReport& report) {
    std::string text = report.port + ": " + count(report.tests, "test") + "\n";
    for (const auto& [sentence, sights] : report.broken) text += textOfBroken(sentence, sights);
    if (!report.broken.empty()) text += "\n";
    for (const auto& [test, why] : report.skipped) {
        text += wrapped("not looked at here: " + test + ": " + why, "  ");
    }
    for (const std::string& part : report.notMade) {
        text += "  the port makes no " + part + ": what it promises is not looked at\n";
    }
    for (const OptionalService service : report.absent) {
        text += wrapped("without " + std::string(nameOf(service)) + ": " +
                            std::string(meaningOfAbsence(service)),
                        "  ");
    }
    return text + report.port + ": " + count(report.kept.size(), "sentence") + " kept, " +
           std::to_string(report.broken.size()) + " broken\n";
}

std::string jsonOf(const std::vector<PortReport>& reports) {
    return "{\"ports\": " + jsonArray(reports, jsonOfPort) + "}\n";
}

}  // namespace appsync
