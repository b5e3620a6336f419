#pragma once

#include <regex>
#include <string>
#include <utility>
#include <vector>

#include "simulation/SimulatedPlatform.h"

namespace appsync {

/// A line of a recording with "TODO", "AREA", "MEDIA", "A" and "B" for the todo directory, the work
/// area, the public staging directory and two applications, and "ENTRIES" for the todo list. Sizes
/// are left out.
inline std::string abbreviated(std::string line) {
    const std::vector<std::pair<const char*, const char*>> names{
        {R"(/var/mobile/Library/ApplicationSync/VessikStuff)", "TODO"},
        {R"(/var/mobile/Library/ApplicationSync)", "AREA"},
        {R"(/var/mobile/Media/PublicStaging)", "MEDIA"},
        {R"(com\.example\.a)", "A"},
        {R"(com\.example\.b)", "B"},
        {R"(\(\{identifier.*?\}\))", "ENTRIES"},
        {R"(,? ?<\d+ bytes>)", ""}};
    for (const auto& [name, abbreviation] : names) {
        line = std::regex_replace(line, std::regex(name), abbreviation);
    }
    return line;
}

/// Every call and every message of the recording, in order, a line each, abbreviated. Results of
/// calls and the encoding of property lists are left out.
inline std::string abbreviatedRecording(const SimulatedPlatform& platform) {
    std::string text = "\n";
    for (RecordEntry entry : platform.recording()) {
        if (entry.service == "PropertyListSerialization") continue;
        entry.result.clear();
        text += abbreviated(entry.line()) + "\n";
    }
    return text;
}

}  // namespace appsync
