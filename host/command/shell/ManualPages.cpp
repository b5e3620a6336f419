#include "host/command/shell/ManualPages.h"

#include <algorithm>
#include <cctype>
#include <utility>

namespace appsync {
namespace {

// As troff prints it as it stands: no escape, no request at the beginning of a line, no other dash.
std::string escaped(const std::string& text) {
    std::string result;
    for (const char each : text) {
        if (each == '\\') {
            result += "\\e";
        } else if (each == '-') {
            result += "\\-";
        } else if ((each == '.' || each == '\'') && (result.empty() || result.back() == '\n')) {
            result += "\\&";
            result += each;
        } else {
            result += each;
        }
    }
    return result;
}

std::string bold(const std::string& text) { return "\\fB" + escaped(text) + "\\fR"; }
std::string slanted(const std::string& text) { return "\\fI" + escaped(text) + "\\fR"; }

std::string upperCase(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char each) { return static_cast<char>(std::toupper(each)); });
    return text;
}

std::string replaced(std::string text, char from, char to) {
    std::replace(text.begin(), text.end(), from, to);
    return text;
}

// "--wait TIME", "DEVICE", "--mirror[=empty]"
std::string shownOption(const OptionEntry& option) {
    if (option.isPlaced) return slanted(option.name);
    if (option.value.empty()) return bold(option.name);
    if (option.value.starts_with('[')) return bold(option.name) + escaped(option.value);
    return bold(option.name) + " " + slanted(option.value);
}

std::string synopsis(const std::string& typed, const CommandEntry& command) {
    std::string text = bold(typed);
    if (!command.commands.empty()) text += " " + slanted("COMMAND");
    for (const OptionEntry& each : command.options) {
        if (each.isPlaced || each.name == "--help") continue;
        text += " [" + shownOption(each) + "]" + (each.isRepeated ? "..." : "");
    }
    for (const OptionEntry& each : command.options) {
        if (!each.isPlaced) continue;
        const std::string shown = shownOption(each) + (each.isRepeated ? "..." : "");
        text += each.isRequired ? " " + shown : " [" + shown + "]";
    }
    return text + "\n";
}

// A list of the options that are placed, or of those that are not.
std::string optionList(const CommandEntry& command, bool isPlaced, const std::string& title) {
    std::string text;
    for (const OptionEntry& each : command.options) {
        if (each.isPlaced != isPlaced) continue;
        text += ".TP\n" + shownOption(each) + "\n" + escaped(each.description) + "\n";
    }
    return text.empty() ? text : ".SH " + title + "\n" + text;
}

std::string commandList(const std::string& typed, const CommandEntry& command) {
    std::string text;
    for (const CommandEntry& each : command.commands) {
        text += ".TP\n" + bold(typed + " " + each.name) + "\n" + escaped(each.description) + "\n";
    }
    return text.empty() ? text : ".SH COMMANDS\n" + text;
}

bool takes(const CommandEntry& command, const std::string& argument) {
    return std::any_of(
        command.options.begin(), command.options.end(),
        [&argument](const OptionEntry& each) { return each.isPlaced && each.name == argument; });
}

// What is installed besides of a device's directory and of a backup (cmake/format_pages.py).
std::string references(const std::string& page, const CommandEntry& command, bool isProgram) {
    std::vector<std::string> pages;
    if (!isProgram) pages.push_back(bold("appsync") + "(1)");
    for (const CommandEntry& each : command.commands) {
        pages.push_back(bold(page + "-" + each.name) + "(1)");
    }
    for (const auto& [argument, format] : {std::pair{"DEVICE", "device"}, {"BACKUP", "backup"}}) {
        if (isProgram || takes(command, argument)) {
            pages.push_back(bold(std::string("appsync-") + format) + "(5)");
        }
    }
    std::string text;
    for (const std::string& each : pages) text += (text.empty() ? "" : ",\n") + each;
    return text.empty() ? text : ".SH SEE ALSO\n" + text + "\n";
}

struct Writer {
    const std::string& ending;
    const std::string& version;
    std::vector<ManualPage> pages;

    // `typed` is the command as it is typed: "appsync package make".
    void write(const CommandEntry& command, const std::string& typed) {
        const std::string page = replaced(typed, ' ', '-');
        std::string text =
            ".TH " + upperCase(escaped(page)) + " 1 \"\" \"appsync " + version + "\" \"appsync\"\n";
        text += ".SH NAME\n" + escaped(page) + " \\- " + escaped(command.description) + "\n";
        text += ".SH SYNOPSIS\n.nh\n.ad l\n" + synopsis(typed, command) + ".hy\n.ad b\n";
        text += commandList(typed, command);
        text += optionList(command, true, "ARGUMENTS");
        text += optionList(command, false, "OPTIONS");
        text += ".SH NOTES\n" + escaped(ending) + "\n";
        text += references(page, command, typed == page);
        pages.push_back({page + ".1", std::move(text)});
        for (const CommandEntry& each : command.commands) write(each, typed + " " + each.name);
    }
};

}  // namespace

std::vector<ManualPage> manualPages(const CommandEntry& program, const std::string& ending,
                                    const std::string& version) {
    Writer writer{ending, version, {}};
    writer.write(program, program.name);
    return std::move(writer.pages);
}

}  // namespace appsync
