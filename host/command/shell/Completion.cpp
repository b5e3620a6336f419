#include "host/command/shell/Completion.h"

#include <algorithm>
#include <set>
#include <sstream>
#include <string_view>

#include "host/console/Text.h"

namespace appsync {
namespace {

// The words before the last one, understood.
struct LineSoFar {
    const CommandEntry* command = nullptr;
    std::vector<std::string> placed;      // the arguments that are known by their places
    std::set<std::string> given;          // options
    const OptionEntry* asking = nullptr;  // the option whose value comes next
    bool isOnlyPlaced = false;            // behind "--"
};

template <typename Entries>
auto* entryNamed(const Entries& entries, const std::string& name) {
    const auto found = std::find_if(entries.begin(), entries.end(),
                                    [&name](const auto& each) { return each.name == name; });
    return found == entries.end() ? nullptr : &*found;
}

void takeOption(LineSoFar& line, const std::string& word) {
    const std::size_t equals = word.find('=');
    const std::string name = word.substr(0, equals);
    line.given.insert(name);
    const OptionEntry* const option = entryNamed(line.command->options, name);
    if (option == nullptr || equals != std::string::npos) return;
    const bool takesNext = !option->value.empty() && !option->value.starts_with('[');
    if (takesNext) line.asking = option;
}

void takeWord(LineSoFar& line, const std::string& word) {
    if (line.asking != nullptr) {
        line.asking = nullptr;
    } else if (word == "--" && !line.isOnlyPlaced) {
        line.isOnlyPlaced = true;
    } else if (word.starts_with('-') && word != "-" && !line.isOnlyPlaced) {
        takeOption(line, word);
    } else if (const CommandEntry* const inner = entryNamed(line.command->commands, word)) {
        line.command = inner;
    } else {
        line.placed.push_back(word);
    }
}

// "help COMMAND" is for a command what the command is.
LineSoFar understand(const CommandEntry& program, const std::vector<std::string>& words) {
    LineSoFar line;
    line.command = &program;
    for (std::size_t index = 0; index + 1 < words.size(); ++index) {
        if (index == 0 && words[index] == "help") continue;
        takeWord(line, words[index]);
    }
    return line;
}

bool isDirectory(const std::string& value) {
    return value == kNewPlace || value == "LIBRARY" || value == "BACKUP" || value == "FOLDER";
}

// The argument that stands at this place; the last may stand there several times.
const OptionEntry* placedAt(const CommandEntry& command, std::size_t place) {
    const OptionEntry* last = nullptr;
    for (const OptionEntry& each : command.options) {
        if (!each.isPlaced) continue;
        last = &each;
        if (place-- == 0) return last;
    }
    return last != nullptr && last->isRepeated ? last : nullptr;
}

// The device that the line names, if its command takes one.
std::string deviceOf(const LineSoFar& line) {
    for (std::size_t place = 0; place < line.placed.size(); ++place) {
        const OptionEntry* const argument = placedAt(*line.command, place);
        if (argument != nullptr && argument->name == "DEVICE") return line.placed[place];
    }
    return "";
}

class Finder {
  public:
    Finder(const LineSoFar& line, const std::string& begun, const IdentifiersOfDevice& identifiers)
        : line_(line), begun_(begun), identifiers_(identifiers) {}

    Completions find() {
        const OptionEntry* const next = placedAt(*line_.command, line_.placed.size());
        const bool isCommand = !line_.command->commands.empty();
        const bool isFull = next == nullptr && !isCommand;
        if (line_.asking != nullptr) {
            addValues(line_.asking->value);
        } else if (isFull || (begun_.starts_with('-') && !line_.isOnlyPlaced)) {
            if (!line_.isOnlyPlaced) addOptions();
        } else if (isCommand) {
            if (line_.placed.empty()) addCommands();
        } else {
            addArgument(*next);
        }
        return std::move(found_);
    }

  private:
    void add(const std::string& word, const std::string& description = "") {
        if (word.starts_with(begun_)) found_.candidates.push_back({word, description});
    }

    void addCommands() {
        for (const CommandEntry& each : line_.command->commands) add(each.name, each.description);
    }

    void addOptions() {
        for (const OptionEntry& each : line_.command->options) {
            if (each.isPlaced || (line_.given.contains(each.name) && !each.isRepeated)) continue;
            add(each.name, each.description);
        }
    }

    void addArgument(const OptionEntry& argument) {
        // One of two things that are there: a directory or a file.
        if (!wordsOfValue(argument.name).empty()) {
            found_.paths = Completions::Paths::Files;
            return;
        }
        if (argument.name == "NAME=VALUE") return addSettings(argument.description);
        const bool saysMore = argument.value == kNewPlace || !wordsOfValue(argument.value).empty();
        addValues(saysMore ? argument.value : argument.name);
    }

    // The description names them: "coordination=on|off". Each is set once.
    void addSettings(const std::string& description) {
        std::istringstream settings(description);
        for (std::string each; settings >> each;) {
            const std::size_t behindName = each.find('=') + 1;
            const std::string name = each.substr(0, behindName);
            const bool isSet =
                std::any_of(line_.placed.begin(), line_.placed.end(),
                            [&name](const std::string& word) { return word.starts_with(name); });
            if (isSet) continue;
            for (const std::string& value : wordsOfValue(each.substr(behindName))) {
                add(name + value);
            }
        }
    }

    void addValues(const std::string& value) {
        const std::vector<std::string> words = wordsOfValue(value);
        if (value == "ID") {
            for (const std::string& each : identifiers_(deviceOf(line_))) add(each);
        } else if (!words.empty()) {
            for (const std::string& each : words) add(each);
        } else if (value == "DEVICE") {
            found_.paths = Completions::Paths::Devices;
        } else if (isDirectory(value)) {
            found_.paths = Completions::Paths::Directories;
        } else if (value != "N" && value != "TIME") {
            found_.paths = Completions::Paths::Files;
        }
    }

    const LineSoFar& line_;
    const std::string& begun_;
    const IdentifiersOfDevice& identifiers_;
    Completions found_;
};

// bash gives the words of the line as they were typed: backslashes are taken off here. It parts
// them at "=" too, and replaces what stands behind that alone.
constexpr std::string_view kBashScript =
    R"(# bash completion of appsync: made by "appsync completion bash".
_appsync() {
    local line each found before words=()
    for each in "${COMP_WORDS[@]:1:COMP_CWORD}"; do
        if [ ${#words[@]} -gt 0 ] && { [ "$each" = "=" ] || [[ ${words[-1]} == *= ]]; }; then
            words[-1]+=$each
        else
            words+=("$each")
        fi
    done
    before=${words[-1]%"${words[-1]##*=}"}
    if [[ $COMP_WORDBREAKS != *=* ]]; then before=; fi
    words=("${words[@]//\\/}")
    words=("${words[@]/#\~\//$HOME/}")
    COMPREPLY=()
    while IFS= read -r line; do
        case $line in
        :devices)
            compopt -o filenames 2>/dev/null
            mapfile -t found < <(compgen -d -- "${COMP_WORDS[COMP_CWORD]}")
            for each in "${found[@]}"; do
                if [ -f "${each/#\~\//$HOME/}/device.db" ]; then COMPREPLY+=("$each"); fi
            done
            if [ ${#COMPREPLY[@]} -eq 0 ]; then COMPREPLY=("${found[@]}"); fi ;;
        :directories) compopt -o filenames 2>/dev/null; mapfile -t COMPREPLY < <(compgen -d -- "${COMP_WORDS[COMP_CWORD]}") ;;
        :files) compopt -o filenames 2>/dev/null; mapfile -t COMPREPLY < <(compgen -f -- "${COMP_WORDS[COMP_CWORD]}") ;;
        *) line=${line%%$'\t'*}; COMPREPLY+=("${line#"$before"}") ;;
        esac
    done < <("${COMP_WORDS[0]}" complete -- "${words[@]}" 2>/dev/null)
}
complete -F _appsync appsync
)";

constexpr std::string_view kZshScript = R"(#compdef appsync
# zsh completion of appsync: made by "appsync completion zsh".
_appsync_is_device() { [[ -f $REPLY/device.db ]] }
_appsync() {
    local line
    local -a described
    for line in "${(@f)$("${(Q)words[1]}" complete -- "${(@Q)words[2,CURRENT]}" 2>/dev/null)}"; do
        case $line in
        '') ;;
        :devices) _path_files -g '*(-/+_appsync_is_device)' || _path_files -/ ;;
        :directories) _path_files -/ ;;
        :files) _files ;;
        *) described+=("${${line%%$'\t'*}//:/\\:}:${line#*$'\t'}") ;;
        esac
    done
    (( ${#described} )) && _describe 'appsync' described
}
if [ "$funcstack[1]" = "_appsync" ]; then _appsync "$@"; else compdef _appsync appsync; fi
)";

constexpr std::string_view kFishScript =
    R"(# fish completion of appsync: made by "appsync completion fish".
function __appsync_complete
    set -l words (commandline -opc)
    set -l current (commandline -ct)
    for line in ($words[1] complete -- $words[2..-1] $current 2>/dev/null)
        switch $line
            case ':devices'
                set -l found (__fish_complete_directories $current)
                set -l devices
                for each in $found
                    set -l place (string replace -r '^~/' "$HOME/" -- (string split -m 1 \t -- $each)[1])
                    test -f "$place/device.db"; and set -a devices $each
                end
                set -q devices[1]; or set devices $found
                set -q devices[1]; and printf '%s\n' $devices
            case ':directories'
                __fish_complete_directories $current
            case ':files'
                __fish_complete_path $current
            case '*'
                echo $line
        end
    end
end
complete -c appsync -f -a '(__appsync_complete)'
)";

}  // namespace

std::vector<std::string> wordsOfValue(const std::string& value) {
    std::vector<std::string> words;
    if (value.find('|') == std::string::npos) return words;
    std::size_t begin = 0;
    for (std::size_t bar = 0; bar != std::string::npos; begin = bar + 1) {
        bar = value.find('|', begin);
        words.push_back(value.substr(begin, bar == std::string::npos ? bar : bar - begin));
    }
    return words;
}

Completions completionsOf(const CommandEntry& program, const std::vector<std::string>& words,
                          const IdentifiersOfDevice& identifiers) {
    const LineSoFar line = understand(program, words);
    const std::string begun = words.empty() ? "" : words.back();
    return Finder(line, begun, identifiers).find();
}

std::string completionLines(const Completions& completions) {
    std::string lines;
    for (const auto& [word, description] : completions.candidates) {
        lines += printable(word) + '\t' + printable(description) + '\n';
    }
    if (completions.paths == Completions::Paths::Devices) lines += ":devices\n";
    if (completions.paths == Completions::Paths::Directories) lines += ":directories\n";
    if (completions.paths == Completions::Paths::Files) lines += ":files\n";
    return lines;
}

std::string completionScript(const std::string& shell) {
    if (shell == "bash") return std::string(kBashScript);
    if (shell == "zsh") return std::string(kZshScript);
    if (shell == "fish") return std::string(kFishScript);
    return "";
}

}  // namespace appsync
