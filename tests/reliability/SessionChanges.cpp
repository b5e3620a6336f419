#include "tests/reliability/SessionChanges.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <map>
#include <set>
#include <stdexcept>

namespace appsync {
namespace {

std::string joined(const std::set<std::size_t>& draws) {
    std::string text;
    for (const std::size_t draw : draws) {
        text.append(text.empty() ? "" : ",").append(std::to_string(draw));
    }
    return text;
}

std::string joined(const std::map<std::size_t, std::uint64_t>& numbers) {
    std::string text;
    for (const auto& [draw, number] : numbers) {
        text.append(text.empty() ? "" : ",").append(std::to_string(draw));
        text.append("=").append(std::to_string(number));
    }
    return text;
}

std::uint64_t numberOf(std::string_view text) {
    std::uint64_t number = 0;
    const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
    if (read.ec != std::errc{} || read.ptr != text.data() + text.size()) {
        throw std::invalid_argument("no number: " + std::string(text));
    }
    return number;
}

// Takes the text up to the next mark off its front, and the mark.
std::string_view nextPiece(std::string_view& text, char mark) {
    const std::string_view piece = text.substr(0, text.find(mark));
    text.remove_prefix(std::min(piece.size() + 1, text.size()));
    return piece;
}

std::set<std::size_t> drawsOf(std::string_view text) {
    std::set<std::size_t> draws;
    while (!text.empty()) draws.insert(numberOf(nextPiece(text, ',')));
    return draws;
}

std::map<std::size_t, std::uint64_t> replacedOf(std::string_view text) {
    std::map<std::size_t, std::uint64_t> numbers;
    while (!text.empty()) {
        std::string_view number = nextPiece(text, ',');
        const std::size_t draw = numberOf(nextPiece(number, '='));
        numbers[draw] = numberOf(number);
    }
    return numbers;
}

struct Source {
    std::string_view kept;
    std::string_view replaced;
    ChanceChanges SessionChanges::*changes;
};

constexpr std::array kSources = {Source{"choices", "new-choices", &SessionChanges::choices},
                                 Source{"faults", "new-faults", &SessionChanges::faults},
                                 Source{"turns", "new-turns", &SessionChanges::turns}};

void change(SessionChanges& changes, std::string_view name, std::string_view value) {
    for (const Source& source : kSources) {
        if (name == source.kept) {
            (changes.*source.changes).kept = drawsOf(value);
            return;
        }
        if (name == source.replaced) {
            (changes.*source.changes).replaced = replacedOf(value);
            return;
        }
    }
    if (name == "fault-seed") {
        changes.faultSeed = numberOf(value);
    } else if (name == "turn-seed") {
        changes.turnSeed = numberOf(value);
    } else {
        throw std::invalid_argument("nothing of a session: " + std::string(name));
    }
}

}  // namespace

std::string textOf(const SessionChanges& changes) {
    std::string text;
    const auto add = [&](std::string_view name, const std::string& value) {
        text.append(text.empty() ? "" : ";").append(name).append(":").append(value);
    };
    for (const Source& source : kSources) {
        const ChanceChanges& of = changes.*source.changes;
        if (of.kept) add(source.kept, joined(*of.kept));
        if (!of.replaced.empty()) add(source.replaced, joined(of.replaced));
    }
    if (changes.faultSeed) add("fault-seed", std::to_string(*changes.faultSeed));
    if (changes.turnSeed) add("turn-seed", std::to_string(*changes.turnSeed));
    return text;
}

SessionChanges changesOf(std::string_view text) {
    SessionChanges changes;
    while (!text.empty()) {
        std::string_view value = nextPiece(text, ';');
        const std::string_view name = nextPiece(value, ':');
        change(changes, name, value);
    }
    return changes;
}

}  // namespace appsync
