#include "host/command/CommandLine.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <memory>
#include <optional>
#include <ostream>
#include <sstream>
#include <string_view>
#include <system_error>
#include <utility>

#include <CLI/CLI.hpp>

#include "host/command/CommandTable.h"
#include "host/command/MeantWord.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/change/ChangeCommands.h"
#include "host/command/data/DataCommands.h"
#include "host/command/file/FileCommands.h"
#include "host/command/look/LookCommands.h"
#include "host/command/shell/ShellCommands.h"
#include "host/command/sync/SyncCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/module/PlugInModule.h"

namespace appsync {
namespace {

constexpr const char* kDescription =
    "appsync keeps the applications of a device in step with a folder of packages.";
constexpr const char* kFooter =
    "Exit status: 0 done; 1 something failed, each failure named; 2 wrong usage;\n"
    "3 the device or the library cannot be used.";

// The words that an option knows, with an error that names them.
CLI::Validator oneOf(const std::vector<std::string>& words) {
    std::string listed;
    for (const std::string& word : words) listed += (listed.empty() ? "" : ", ") + word;
    return {[words, listed](const std::string& given) {
                const bool isKnown = std::find(words.begin(), words.end(), given) != words.end();
                return isKnown ? std::string() : shownArgument(given) + " is none of " + listed;
            },
            ""};
}

std::optional<std::int64_t> wholeNumber(std::string_view text) {
    std::int64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return number;
}

// A whole number of that range, with an error that says so.
CLI::Validator wholeNumberFrom(std::int64_t least, std::int64_t most) {
    return {[least, most](const std::string& given) {
                const std::optional<std::int64_t> number = wholeNumber(given);
                if (number && *number >= least && *number <= most) return std::string();
                return shownArgument(given) + " is no whole number from " + std::to_string(least) +
                       " to " + std::to_string(most);
            },
            ""};
}

CLI::Validator anyWholeNumber() {
    return {[](const std::string& given) {
                return wholeNumber(given) ? "" : shownArgument(given) + " is no whole number";
            },
            ""};
}

// Where the text of a line of help begins that is to be broken: behind the name of the option.
std::size_t helpColumn(const std::string& line) {
    const std::size_t begin = line.find_first_not_of(' ');
    const std::size_t gap = line.find("  ", begin);
    const std::size_t text = gap == std::string::npos ? gap : line.find_first_not_of(' ', gap);
    constexpr std::size_t kFarthest = 40;
    return text > kFarthest ? begin + 2 : text;
}

// The text with its long lines broken between words.
std::string brokenAt80(const std::string& text) {
    constexpr std::size_t kWidth = 79;  // some terminals go on to the next line at the 80th
    std::string broken;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        const std::size_t column = line.size() > kWidth ? helpColumn(line) : 0;
        while (line.size() > kWidth) {
            const std::size_t blank = line.rfind(' ', kWidth);
            if (blank == std::string::npos || blank <= column) break;
            broken += line.substr(0, blank) + "\n";
            line = std::string(column, ' ') + line.substr(blank + 1);
        }
        broken += line + "\n";
    }
    return broken;
}

constexpr std::int64_t kLongestWait = std::int64_t{365} * 24 * 3600;

// "90", "90s", "5m", "1h".
std::optional<std::chrono::seconds> duration(std::string_view text) {
    static constexpr std::string_view kUnits = "smh";
    std::int64_t factor = 1;
    if (const std::size_t unit = text.empty() ? text.npos : kUnits.find(text.back());
        unit != text.npos) {
        for (std::size_t step = 0; step < unit; ++step) factor *= 60;
        text.remove_suffix(1);
    }
    const std::optional<std::int64_t> number = wholeNumber(text);
    if (!number || *number < 0 || *number > kLongestWait / factor) return std::nullopt;
    return std::chrono::seconds(*number * factor);
}

// "1.5": not negative.
std::optional<double> secondsIn(std::string_view text) {
    double number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool isNumber = error == std::errc() && end == text.data() + text.size();
    return isNumber && std::isfinite(number) && number >= 0 ? std::optional(number) : std::nullopt;
}

// Declares the commands and remembers which one was chosen. The values that options are parsed into
// live as long as the commands' actions.
class Commands {
  public:
    explicit Commands(const Console& console) : console_(console), app_(kDescription, "appsync") {
        app_.require_subcommand(1);
        app_.footer(kFooter);
        app_.set_version_flag(
            "--version",
            "appsync " APPSYNC_VERSION ", module interface " + moduleInterfaceVersion(),
            "Print the version, and that of the plug-in modules it loads, and exit");
        addSync();
        addPlan();
        addStage();
        addSend();
        addDevice();
        addLook();
        addLog();
        addServe();
        addCoordination();
        addBackup();
        addRestore();
        addDiff();
        addPackage();
        addData();
        addPropertyList();
        addRecordings();
        addReplay();
        addShell();
        app_.add_subcommand("help", "Show the help of a command (= COMMAND --help)");
        refuseEmptyValues(app_);
    }

    int run(std::vector<std::string> arguments) {
        // What the completion of a shell asks about a line that is not at its end.
        if (!arguments.empty() && arguments.front() == "complete") {
            arguments.erase(arguments.begin());
            return runComplete(commandTable(app_), arguments, console_);
        }
        if (!arguments.empty() && arguments.front() == "help") {
            arguments.erase(arguments.begin());
            if (const Status known = checkCommands(arguments); !known) {
                return console_.fail(known.error());
            }
            arguments.emplace_back("--help");
        }
        if (!arguments.empty() && isUnknownCommand(arguments.front())) {
            return console_.fail(comesLate(arguments)
                                     ? wrongUsage("there is no command " + arguments.front(),
                                                  "the command comes first, " + helpOf(app_))
                                     : unknownCommand(app_, arguments.front()));
        }
        if (const Status given = checkValues(arguments); !given)
            return console_.fail(given.error());
        // The parser would print the version, and pass over what follows.
        if (arguments.size() > 1 && arguments.front() == "--version") {
            return console_.fail(wrongUsage(
                shownArgument(arguments[1]) + " is one argument too many for appsync --version",
                helpOf(app_)));
        }
        const std::optional<ErrorRecord> misplaced = deviceComesLate(arguments);
        std::reverse(arguments.begin(), arguments.end());  // as CLI11 wants them
        try {
            app_.parse(std::move(arguments));
        } catch (const CLI::Success& help) {
            std::ostringstream text;
            app_.exit(help, text, text);
            console_.out << brokenAt80(text.str());
            return kExitDone;
        } catch (const CLI::ParseError& error) {
            return console_.fail(misplaced ? *misplaced : whatIsWrong(error));
        }
        console_.help = typed(chosen()) + " --help";
        if (const Status placed = checkPlaceOfDevice(); !placed)
            return console_.fail(placed.error());
        return action_ ? action_() : kExitWrongUsage;
    }

  private:
    // What an option says itself of a value that it does not know comes first.
    static void refuseEmptyValues(CLI::App& command) {
        for (CLI::Option* option : command.get_options()) {
            if (option->get_items_expected_max() == 0 || option->get_positional()) continue;
            option->check(CLI::Validator(
                [](const std::string& given) {
                    return given.empty() ? std::string("it needs another value than ''")
                                         : std::string();
                },
                ""));
        }
        for (CLI::App* each : command.get_subcommands([](CLI::App*) { return true; }))
            refuseEmptyValues(*each);
    }

    [[nodiscard]] bool isUnknownCommand(const std::string& name) const {
        const auto known = app_.get_subcommands(
            [&name](const CLI::App* command) { return command->get_name() == name; });
        return !name.starts_with('-') && known.empty();
    }

    // Whether the command stands behind its first argument.
    [[nodiscard]] bool comesLate(const std::vector<std::string>& words) const {
        if (words.size() < 2 || words[0].empty() || words[1].starts_with('-')) return false;
        return !isUnknownCommand(words[1]);
    }

    // What is wrong with the words, if anything is, where the action of `coordinator` stands before
    // the device, as a command of `package` or `data` does.
    static std::optional<ErrorRecord> deviceComesLate(const std::vector<std::string>& words) {
        const auto isAction = [&words](std::size_t place) {
            return place < words.size() &&
                   std::ranges::count(coordinatorActions(), words[place]) > 0;
        };
        if (words.empty() || words[0] != "coordinator" || !isAction(1) || isAction(2)) return {};
        const std::string rest = words[1] == "list" ? "" : " ID";
        return wrongUsage("DEVICE comes before " + words[1],
                          "try appsync coordinator DEVICE " + words[1] + rest +
                              ", or see appsync coordinator --help");
    }

    static const std::vector<std::string>& coordinatorActions() {
        static const std::vector<std::string> actions{"list", "create", "cancel"};
        return actions;
    }

    // Whether the words are a command, and a command of that one.
    [[nodiscard]] Status checkCommands(const std::vector<std::string>& words) const {
        const CLI::App* command = &app_;
        for (const std::string& word : words) {
            const auto known = command->get_subcommands(
                [&word](const CLI::App* each) { return each->get_name() == word; });
            if (known.empty()) return unknownCommand(*command, word);
            command = known.front();
        }
        return {};
    }

    // Another argument may be the device: everything that follows would tell of the wrong one.
    [[nodiscard]] Status checkPlaceOfDevice() const {
        const CLI::App& command = chosen();
        const CLI::Option* device = command.get_option_no_throw("DEVICE");
        if (device == nullptr || device->empty()) return {};
        const std::string& given = device->results().front();
        if (looksLikeDevice(given)) return {};
        for (const CLI::Option* each : command.get_options()) {
            if (!each->get_positional()) continue;
            for (const std::string& word : each->results()) {
                if (!looksLikeDevice(word)) continue;
                return unusable(shownArgument(given) + " is no device, and " + word + " is one",
                                "DEVICE is the first argument: " + helpOf(command));
            }
        }
        return {};
    }

    // An option that ends in "=" would take the next word for its value, and a flag that is given
    // one would be on or off by what that says.
    [[nodiscard]] Status checkValues(const std::vector<std::string>& words) const {
        const CLI::App* command = &app_;
        for (const std::string& word : words) {
            const auto known = command->get_subcommands(
                [&word](const CLI::App* each) { return each->get_name() == word; });
            if (!known.empty()) command = known.front();
            if (word == "--") break;
            const std::size_t equals = word.find('=');
            if (!word.starts_with("--") || equals == std::string::npos) continue;
            const std::string name = word.substr(0, equals);
            const CLI::Option* option = command->get_option_no_throw(name);
            if (option == nullptr) continue;
            if (isPlainFlag(*option)) {
                return wrongUsage(name + " takes no value", helpOf(*command));
            }
            if (equals != word.size() - 1) continue;
            return wrongUsage(name + " needs another value than ''", helpOf(*command));
        }
        return {};
    }

    static bool isPlainFlag(const CLI::Option& option) {
        return option.get_items_expected_max() == 0 && option.get_option_text().empty();
    }

    // The command that the arguments name.
    [[nodiscard]] const CLI::App& chosen() const {
        const CLI::App* command = &app_;
        while (!command->get_subcommands().empty()) command = command->get_subcommands().front();
        return *command;
    }

    // A command as it is typed: "appsync package make".
    static std::string typed(const CLI::App& command) {
        const CLI::App* parent = command.get_parent();
        return (parent == nullptr ? "" : typed(*parent) + " ") + command.get_name();
    }

    // What to do about what nobody knows, where the help is, and what may have been meant.
    static std::string helpOf(const CLI::App& command, const std::string& meant = "") {
        const std::string tried = meant.empty() ? "" : "try " + meant + ", or ";
        return tried + "see " + typed(command) + " --help";
    }

    static ErrorRecord unknownCommand(const CLI::App& command, const std::string& word) {
        std::vector<std::string> known;
        for (const CLI::App* each : command.get_subcommands([](const CLI::App*) { return true; })) {
            known.push_back(each->get_name());
        }
        const std::string of = command.get_parent() == nullptr ? "" : " of " + typed(command);
        return wrongUsage("there is no command " + shownArgument(word) + of,
                          helpOf(command, meantWord(word, known)));
    }

    static ErrorRecord unknownOption(const CLI::App& command, const std::string& word) {
        std::vector<std::string> known;
        for (const CLI::Option* each : command.get_options()) {
            if (!each->get_positional()) known.push_back(each->get_name());
        }
        return wrongUsage(word + " is not an option of " + typed(command),
                          helpOf(command, meantWord(word.substr(0, word.find('=')), known)));
    }

    // What nobody knows is told before what is missing, which it may have been meant to be.
    [[nodiscard]] ErrorRecord whatIsWrong(const CLI::ParseError& error) const {
        const CLI::App& command = chosen();
        const std::vector<std::string> unknown = app_.remaining(true);
        for (const std::string& word : unknown) {
            if (word.starts_with('-')) return unknownOption(command, word);
        }
        if (unknown.empty()) return wrongUsage(inOwnWords(error), helpOf(command));
        if (command.get_require_subcommand_min() > 0) {
            return unknownCommand(command, unknown.front());
        }
        return wrongUsage(
            shownArgument(unknown.front()) + " is one argument too many for " + typed(command),
            helpOf(command));
    }

    // What the parser says of an option begins with its name.
    [[nodiscard]] std::string inOwnWords(const CLI::ParseError& error) const {
        const std::string told = error.what();
        const std::string option = told.substr(0, told.find(':'));
        if (dynamic_cast<const CLI::ArgumentMismatch*>(&error) != nullptr) {
            const bool isTooOften = told.find(": At Most ") != std::string::npos;
            return option + (isTooOften ? " is given more than once" : " needs a value");
        }
        if (dynamic_cast<const CLI::ConversionError*>(&error) != nullptr) {
            return "an option of " + typed(chosen()) + " does not take its value";
        }
        if (dynamic_cast<const CLI::ExcludesError*>(&error) != nullptr) {
            constexpr std::string_view kExcludes = " excludes ";
            const std::size_t verb = told.find(kExcludes);
            if (verb == std::string::npos) return told;
            return told.substr(0, verb) + " does not go with " +
                   told.substr(verb + kExcludes.size());
        }
        const bool lacksCommand = dynamic_cast<const CLI::RequiredError*>(&error) != nullptr &&
                                  told.find("subcommand") != std::string::npos;
        return lacksCommand ? typed(chosen()) + " needs a command" : told;
    }

    // A command whose options are parsed into one `Values`.
    template <typename Values>
    CLI::App& command(CLI::App& parent, const std::string& name, const std::string& description,
                      const std::shared_ptr<Values>& values,
                      std::function<int(const Values&)> action) {
        CLI::App& added = *parent.add_subcommand(name, description);
        added.callback([this, values, action = std::move(action)] {
            action_ = [values, action] { return action(*values); };
        });
        return added;
    }

    static void addDisplay(CLI::App& added, SyncDisplayKind& display, bool& isVerbose) {
        added.add_flag("--verbose", isVerbose, "on a terminal, too, print long lists whole");
        CLI::Option* json = added.add_flag_callback(
            "--json", [&display] { display = SyncDisplayKind::Json; }, "print one JSON object");
        added
            .add_flag_callback(
                "--json-lines", [&display] { display = SyncDisplayKind::JsonLines; },
                "print one JSON object per event, the summary last")
            ->excludes(json);
    }

    static void addPlanOptions(CLI::App& added, SyncArguments& values) {
        added.add_option("DEVICE", values.device, "the device's directory")->required();
        added.add_option("LIBRARY", values.library, "the folder of packages")->required();
        added.add_option("--remove", values.plan.remove, "remove this application")
            ->type_name("ID")
            ->expected(1)
            ->take_all()
            ->allow_extra_args(false);  // what follows the identifier is DEVICE or LIBRARY
        addMirror(added, values);
        added.add_option("--only", values.plan.only, "of LIBRARY, sync this application alone")
            ->type_name("ID")
            ->expected(1)
            ->take_all()
            ->allow_extra_args(false);
    }

    static void addStaged(CLI::App& added, SyncArguments& values) {
        added.add_flag("--staged", values.isStaged,
                       "the staging area is there already: send what it asks for");
        addWait(added, values);
    }

    static void addPlugIn(CLI::App& added, std::string& plugIn) {
        added.add_option("--plug-in", plugIn, "run with the plug-in of this module")
            ->type_name("MODULE");
    }

    static void addRecording(CLI::App& added, RecordingArguments& recording) {
        added.add_option("--record", recording.path, "write a recording of the session")
            ->type_name("FILE");
        added.add_flag("--anonymous", recording.isAnonymous,
                       "record with made-up names, and without contents");
    }

    static void addMirror(CLI::App& added, SyncArguments& values) {
        added.add_flag("--mirror")
            ->description("remove every user application that LIBRARY lacks")
            ->option_text("[=empty]")
            ->check(CLI::Validator(
                [&values](const std::string& given) {
                    values.plan.mirror = true;
                    values.mirrorsEmpty = given == "empty";
                    return given == "true" || values.mirrorsEmpty
                               ? std::string()
                               : shownArgument(given) +
                                     " is none of its values: say --mirror or "
                                     "--mirror=empty";
                },
                ""));
    }

    static void addWait(CLI::App& added, SyncArguments& values) {
        CLI::Option* none = added.add_flag_callback(
            "--no-wait", [&values] { values.longestWait = std::chrono::seconds(0); },
            "do not wait for applications that run");
        added
            .add_option_function<std::string>(
                "--wait",
                [&values](const std::string& text) { values.longestWait = duration(text); },
                "wait for what runs so long at most: 90s, 5m, 1h")
            ->type_name("TIME")
            ->check(CLI::Validator(
                [](const std::string& given) {
                    return duration(given) ? std::string()
                                           : shownArgument(given) +
                                                 " is no time: give seconds (90 or 90s), "
                                                 "minutes (5m) or hours (1h)";
                },
                ""))
            ->excludes(none);
    }

    void addSync() {
        const auto values = std::make_shared<SyncArguments>();
        CLI::App& added = command<SyncArguments>(
            app_, "sync", "Bring the device in step with a folder of packages", values,
            [this](const SyncArguments& parsed) { return runSync(parsed, console_); });
        addPlanOptions(added, *values);
        addStaged(added, *values);
        CLI::Option* dry =
            added.add_flag("--dry-run", values->isDryRun, "only say what would be done (= plan)");
        addPlugIn(added, values->plugIn);
        addRecording(added, values->recording);
        added.get_option("--record")->excludes(dry);
        addDisplay(added, values->display, values->isVerbose);
    }

    void addPlan() {
        const auto values = std::make_shared<SyncArguments>();
        values->isDryRun = true;
        CLI::App& added = command<SyncArguments>(
            app_, "plan", "Say what a sync would do and whether it fits", values,
            [this](const SyncArguments& parsed) { return runSync(parsed, console_); });
        addPlanOptions(added, *values);
        addStaged(added, *values);
        added.add_flag_callback(
            "--json", [values] { values->display = SyncDisplayKind::Json; }, "print JSON");
    }

    void addStage() {
        const auto values = std::make_shared<StageArguments>();
        CLI::App& added = command<StageArguments>(
            app_, "stage", "Leave on the device what a sync would, for sync --staged", values,
            [this](const StageArguments& parsed) { return runStage(parsed, console_); });
        addPlanOptions(added, values->sync);
        added.add_flag("--force", values->replaces, "replace a staging area that waits already");
        added.add_flag("--json", values->asJson, "print JSON");
    }

    void addSend() {
        const auto values = std::make_shared<SendArguments>();
        CLI::App& added = command<SendArguments>(
            app_, "send", "Send one package unasked, or a restore's package or data", values,
            [this](const SendArguments& parsed) { return runSend(parsed, console_); });
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        added.add_option("ID", values->identifier, "the application's identifier")->required();
        added.add_option("FILE", values->file, "the package, or the data")->required();
        added.add_flag("--restore", values->isRestore, "it belongs to a restore");
        added
            .add_option(
                "--parts", values->parts,
                "1: the package, its data follows; 2: the data; 3: all at once; without it: 1 "
                "where the device knows of data, else 3")
            ->type_name("N")
            ->check(wholeNumberFrom(1, 3));
        added.add_flag("--yes", values->yes, "replace data that is there, unasked");
        addPlugIn(added, values->plugIn);
        addRecording(added, values->recording);
        addDisplay(added, values->display, values->isVerbose);
    }

    struct DeviceValues {
        std::string device;
        std::string identifier;
        std::string other;
        std::vector<std::string> assignments;
        bool flag = false;
    };
    using DeviceAction = std::function<int(const DeviceValues&)>;

    CLI::App& deviceCommand(const std::string& name, const std::string& description,
                            const std::shared_ptr<DeviceValues>& values, DeviceAction action) {
        CLI::App& added = command<DeviceValues>(app_, name, description, values, std::move(action));
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        return added;
    }

    CLI::App& applicationCommand(const std::string& name, const std::string& description,
                                 const std::shared_ptr<DeviceValues>& values, DeviceAction action) {
        CLI::App& added = deviceCommand(name, description, values, std::move(action));
        added.add_option("ID", values->identifier, "the application's identifier")->required();
        return added;
    }

    void addDevice() {
        addCreate();
        addSet();
        addDemote();
        addAction("run", "Mark an application as running: its termination is denied", runRun);
        addAction("quit", "Mark it as not running any more", runQuit);
        addAction("uninstall", "Remove an application as a person does on the device",
                  runUninstall);
        addAction("rollback", "Bring back what an application's last update has replaced",
                  runRollback);
        const auto reset = std::make_shared<DeviceValues>();
        CLI::App& added = deviceCommand("reset", "Make the device forget what it keeps for syncing",
                                        reset, [this](const DeviceValues& parsed) {
                                            return runReset(parsed.device, parsed.flag, console_);
                                        });
        addJson(added, reset);
    }

    void addAction(const std::string& name, const std::string& description,
                   int (*act)(const ApplicationArguments&, const Console&)) {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added =
            applicationCommand(name, description, values, [this, act](const DeviceValues& parsed) {
                return act(applicationOf(parsed), console_);
            });
        addJson(added, values);
    }

    static ApplicationArguments applicationOf(const DeviceValues& values) {
        return {values.device, values.identifier, values.flag};
    }

    void addCreate() {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added = deviceCommand("create", "Make an empty device in a new directory", values,
                                        [this](const DeviceValues& parsed) {
                                            return runCreate(parsed.device, parsed.other == "on",
                                                             parsed.flag, console_);
                                        });
        added.get_option("DEVICE")->description("the directory to make")->type_name(kNewPlace);
        added.add_option("--coordination", values->other, "whether installs are coordinated")
            ->type_name("on|off")
            ->check(oneOf({"on", "off"}));
        addJson(added, values);
    }

    void addSet() {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added = deviceCommand("set", "Change what the device's owner allows", values,
                                        [this](const DeviceValues& parsed) {
                                            return runSet(parsed.device, parsed.assignments,
                                                          parsed.flag, console_);
                                        });
        added
            .add_option("NAME=VALUE", values->assignments,
                        "installation=yes|no|unset  removal=yes|no|unset  coordination=on|off")
            ->required();
        addJson(added, values);
    }

    void addDemote() {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added = applicationCommand(
            "demote", "Offload an application: its placeholder and its data stay", values,
            [this](const DeviceValues& parsed) {
                return runDemote(applicationOf(parsed), parsed.other == "system", console_);
            });
        added.add_option("--by", values->other, "who does it")
            ->type_name("person|system")
            ->check(oneOf({"person", "system"}));
        addJson(added, values);
    }

    void addJson(CLI::App& added, const std::shared_ptr<DeviceValues>& values) {
        added.add_flag("--json", values->flag, "print JSON");
    }

    void addLook() {
        addLook("apps", "Show installed applications and placeholders", runApps);
        addLook("inventory", "Show what the plug-in reports: deleted, metrics, accounts",
                runInventory);
        addLook("status", "Show the device at a glance: settings, counts, session, space",
                runStatus);
        addHistory();
        addWhy();
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& screen =
            deviceCommand("screen", "Draw the home screen as a PNG picture", values,
                          [this](const DeviceValues& parsed) {
                              return runScreen(parsed.device, parsed.other, parsed.flag, console_);
                          });
        screen.add_option("OUT", values->other, "the picture to write")->required();
        addJson(screen, values);
        addTimeline();
    }

    void addTimeline() {
        const auto values = std::make_shared<TimelineArguments>();
        CLI::App& added = command<TimelineArguments>(
            app_, "timeline", "Draw what happened in a session, application by application", values,
            [this](const TimelineArguments& parsed) { return runTimeline(parsed, console_); });
        added
            .add_option("DEVICE|RECORDING", values->source,
                        "the device directory, or a recording of a session")
            ->required();
        added.add_option("--out", values->picture, "the picture to write: .svg, .png or .html")
            ->type_name("FILE")
            ->required();
        added
            .add_option("--session", values->session,
                        "which of the device's sessions, counted back: 1 is the last")
            ->type_name("N")
            ->check(wholeNumberFrom(1, std::numeric_limits<std::int32_t>::max()));
        added.add_flag("--json", values->asJson, "print JSON");
    }

    void addLook(const std::string& name, const std::string& description,
                 int (*show)(const std::string&, bool, const Console&)) {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added =
            deviceCommand(name, description, values, [this, show](const DeviceValues& parsed) {
                return show(parsed.device, parsed.flag, console_);
            });
        addJson(added, values);
    }

    void addHistory() {
        const auto values = std::make_shared<HistoryArguments>();
        CLI::App& added = command<HistoryArguments>(
            app_, "history", "Show the transaction log", values,
            [this](const HistoryArguments& parsed) { return runHistory(parsed, console_); });
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        added.add_option("--app", values->application, "only what happened to this application")
            ->type_name("ID");
        added.add_flag("--json", values->asJson, "print JSON");
    }

    void addWhy() {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added = applicationCommand(
            "why", "Say what an application waits for", values, [this](const DeviceValues& parsed) {
                return runWhy(parsed.device, parsed.identifier, parsed.flag, console_);
            });
        addJson(added, values);
    }

    void addLog() {
        static const std::map<std::string, LogLevel> kLevels = {{"debug", LogLevel::Debug},
                                                                {"info", LogLevel::Info},
                                                                {"default", LogLevel::Default},
                                                                {"error", LogLevel::Error},
                                                                {"fault", LogLevel::Fault}};
        const auto values = std::make_shared<LogArguments>();
        CLI::App& added = command<LogArguments>(
            app_, "log", "Show the system log", values,
            [this](const LogArguments& parsed) { return runLog(parsed, console_); });
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        added.add_option("--category", values->category, "only this category")
            ->type_name("N")
            ->check(wholeNumberFrom(0, 1'000'000));
        added
            .add_option_function<std::string>(
                "--level", [values](const std::string& name) { values->level = kLevels.at(name); },
                "only this level and those above it")
            ->type_name("debug|info|default|error|fault")
            ->check(oneOf({"debug", "info", "default", "error", "fault"}));
        added.add_option("--app", values->application, "only lines that name this application")
            ->type_name("ID");
        added.add_option("--last", values->last, "only the last N lines of what is wanted")
            ->type_name("N")
            ->check(wholeNumberFrom(1, 1'000'000'000));
        added.add_flag("--follow", values->follows, "go on as lines come");
        added.add_flag("--json", values->asJson, "print the lines as they are kept");
    }

    void addServe() {
        const auto values = std::make_shared<ServeArguments>();
        values->version = APPSYNC_VERSION;
        CLI::App& added = command<ServeArguments>(
            app_, "serve", "Show a device, or a folder of them, live in a browser", values,
            [this](const ServeArguments& parsed) { return runServe(parsed, console_); });
        added.add_option("DEVICE", values->place, "the device's directory, or a folder of devices")
            ->required()
            ->type_name("DEVICE|FOLDER");
        added
            .add_option_function<std::string>(
                "--port",
                [values](const std::string& text) {
                    values->port = static_cast<std::uint16_t>(*wholeNumber(text));
                },
                "the port of 127.0.0.1 to listen on; 0 takes one that is free (default 8017)")
            ->type_name("N")
            ->check(wholeNumberFrom(0, 65535));
    }

    void addCoordination() {
        const auto values = std::make_shared<CoordinatorArguments>();
        CLI::App& added = command<CoordinatorArguments>(
            app_, "coordinator", "Play another client of the coordination service", values,
            [this](const CoordinatorArguments& parsed) {
                return runCoordinator(parsed, console_);
            });
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        added.add_option("ACTION", values->action, "list, create or cancel")
            ->required()
            ->type_name("list|create|cancel")
            ->check(oneOf(coordinatorActions()));
        added.add_option("ID", values->identifier, "the application's identifier");
        added
            .add_option("--client", values->client,
                        "the client to play: 1 is the app store, 3 the sync client (default 2)")
            ->type_name("N")
            ->check(wholeNumberFrom(1, 1'000'000));
        added.add_flag("--json", values->asJson, "print what stands afterwards as JSON");
        addStore();
    }

    void addStore() {
        const auto values = std::make_shared<DeviceValues>();
        CLI::App& added = deviceCommand(
            "store", "Play the app store: keep the promises of restoring applications", values,
            [this](const DeviceValues& parsed) {
                return runStore(parsed.device, parsed.other, parsed.flag, console_);
            });
        added.add_option("FOLDER", values->other, "the store's packages")->required();
        addJson(added, values);
    }

    struct BackupValues {
        BackupArguments backup;
        std::string checked;
    };

    void addBackup() {
        const auto values = std::make_shared<BackupValues>();
        CLI::App& added = command<BackupValues>(
            app_, "backup", "Back a device up into a new folder, or check a backup", values,
            [this](const BackupValues& parsed) { return backUp(parsed); });
        CLI::Option* device =
            added.add_option("DEVICE", values->backup.device, "the device's directory");
        CLI::Option* backup = added.add_option("BACKUP", values->backup.backup,
                                               "the folder to make; it may exist if it is empty");
        added.add_option("--check", values->checked, "only check this backup")
            ->type_name("BACKUP")
            ->excludes(device)
            ->excludes(backup);
        added.add_flag("--json", values->backup.asJson, "print JSON");
    }

    int backUp(const BackupValues& values) {
        if (!values.checked.empty()) {
            return runBackupCheck(values.checked, values.backup.asJson, console_);
        }
        if (!values.backup.backup.empty()) return runBackup(values.backup, console_);
        return console_.fail(wrongUsage("backup needs DEVICE and BACKUP, or --check BACKUP",
                                        "name what is to be backed up, or checked"));
    }

    void addRestore() {
        const auto values = std::make_shared<RestoreArguments>();
        CLI::App& added = command<RestoreArguments>(
            app_, "restore", "Bring the applications of a backup back as placeholders", values,
            [this](const RestoreArguments& parsed) { return runRestore(parsed, console_); });
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        added.add_option("BACKUP", values->backup, "the folder that backup made")->required();
        added
            .add_option_function<std::string>(
                "--type", [values](const std::string& text) { values->type = *wholeNumber(text); },
                "the kind of restore; 2 and 3 bring applications back (default 2)")
            ->type_name("N")
            ->check(anyWholeNumber());
        addPlugIn(added, values->plugIn);
        addRecording(added, values->recording);
        added.add_flag("--json", values->asJson, "print JSON");
    }

    struct FileValues {
        std::string file;
        std::string package;
        bool asJson = false;
    };

    CLI::App& group(const std::string& name, const std::string& description) {
        CLI::App& added = *app_.add_subcommand(name, description);
        added.require_subcommand(1);
        return added;
    }

    void addPackage() {
        CLI::App& parent = group("package", "Make or look at application packages");
        const auto made = std::make_shared<FileValues>();
        CLI::App& make = command<FileValues>(
            parent, "make", "Make a package of a folder that holds NAME.app", made,
            [this](const FileValues& parsed) {
                return runPackageMake(parsed.file, parsed.package, parsed.asJson, console_);
            });
        make.add_option("FOLDER", made->file, "the folder")->required();
        make.add_option("OUT", made->package, "the package to write")->required();
        make.add_flag("--json", made->asJson, "print JSON");
        const auto shown = std::make_shared<FileValues>();
        CLI::App& show =
            command<FileValues>(parent, "show", "Check a package and show what it says of itself",
                                shown, [this](const FileValues& parsed) {
                                    return runPackageShow(parsed.file, parsed.asJson, console_);
                                });
        show.add_option("FILE", shown->file, "the package")->required();
        show.add_flag("--json", shown->asJson, "print JSON");
        addPackageList(parent);
        addPackageVerify(parent);
    }

    void addPackageList(CLI::App& parent) {
        const auto values = std::make_shared<FileValues>();
        CLI::App& added =
            command<FileValues>(parent, "list", "List the packages of a folder", values,
                                [this](const FileValues& parsed) {
                                    return runPackageList(parsed.file, parsed.asJson, console_);
                                });
        added.add_option("FOLDER", values->file, "the folder of packages")->required();
        added.add_flag("--json", values->asJson, "print JSON");
    }

    struct VerifyValues {
        std::vector<std::string> paths;
        bool asJson = false;
    };

    void addPackageVerify(CLI::App& parent) {
        const auto values = std::make_shared<VerifyValues>();
        CLI::App& added = command<VerifyValues>(
            parent, "verify", "Check all that an install would, without a device", values,
            [this](const VerifyValues& parsed) {
                return runPackageVerify(parsed.paths, parsed.asJson, console_);
            });
        added.add_option("FILE", values->paths, "packages, and folders of packages")->required();
        added.add_flag("--json", values->asJson, "print JSON");
    }

    struct DiffValues {
        std::string left;
        std::string right;
        bool asJson = false;
    };

    void addDiff() {
        const auto values = std::make_shared<DiffValues>();
        CLI::App& added = command<DiffValues>(
            app_, "diff", "Compare two devices, backups or libraries", values,
            [this](const DiffValues& parsed) {
                return runDiff(parsed.left, parsed.right, parsed.asJson, console_);
            });
        added.add_option("LEFT", values->left, "a device, a backup or a library")->required();
        added.add_option("RIGHT", values->right, "another one, of any kind")->required();
        added.add_flag("--json", values->asJson, "print JSON");
    }

    void addData() {
        CLI::App& parent = group("data", "List, copy out or replace an application's data");
        addDataCommand(parent, "ls", "List what an application's data consists of", runDataList);
        const auto pulled =
            addDataCommand(parent, "pull", "Copy an application's data out", runDataPull);
        pulled.app
            .add_option("OUT", pulled.values->place, "the folder or the archive (NAME.zip) to make")
            ->required();
        const auto pushed =
            addDataCommand(parent, "push", "Replace an application's data", runDataPush);
        pushed.app.add_option("FROM", pushed.values->place, "the folder or the archive with it")
            ->required();
        pushed.app.add_flag("--yes", pushed.values->yes, "replace data that is there, unasked");
    }

    struct DataCommand {
        CLI::App& app;
        std::shared_ptr<DataArguments> values;
    };

    DataCommand addDataCommand(CLI::App& parent, const std::string& name,
                               const std::string& description,
                               int (*action)(const DataArguments&, const Console&)) {
        const auto values = std::make_shared<DataArguments>();
        CLI::App& added = command<DataArguments>(
            parent, name, description, values,
            [this, action](const DataArguments& parsed) { return action(parsed, console_); });
        added.add_option("DEVICE", values->device, "the device's directory")->required();
        added.add_option("ID", values->identifier, "the application's identifier")->required();
        added.add_flag("--json", values->asJson, "print JSON");
        return {added, values};
    }

    void addPropertyList() {
        CLI::App& parent = group("plist", "Look at or convert property lists");
        const auto shown = std::make_shared<FileValues>();
        CLI::App& show = command<FileValues>(
            parent, "show", "Show a property list of either encoding", shown,
            [this](const FileValues& parsed) {
                return runPropertyListShow(parsed.file, parsed.asJson, console_);
            });
        show.add_option("FILE", shown->file, "the property list, or JSON; - is standard input")
            ->required();
        show.add_flag("--json", shown->asJson, "print JSON");
        addConvert(parent);
    }

    // A time within a session.
    static void addSeconds(CLI::App& added, const std::string& name, std::optional<double>& value,
                           const std::string& description) {
        added
            .add_option_function<std::string>(
                name, [&value](const std::string& text) { value = secondsIn(text); }, description)
            ->type_name("SECONDS")
            ->check(CLI::Validator(
                [](const std::string& given) {
                    return secondsIn(given) ? std::string()
                                            : shownArgument(given) + " is no number of seconds";
                },
                ""));
    }

    void addRecordings() {
        CLI::App& parent = group("recording", "Look at recordings of sessions (--record)");
        const auto shown = std::make_shared<ShowRecordingArguments>();
        CLI::App& show = command<ShowRecordingArguments>(
            parent, "show", "Show what crossed between plug-in and device in a session", shown,
            [this](const ShowRecordingArguments& parsed) {
                return runRecordingShow(parsed, console_);
            });
        show.add_option("FILE", shown->file, "the recording")->required();
        show.add_option("--app", shown->identifier, "what is about this application")
            ->type_name("ID");
        show.add_option("--service", shown->service, "what goes through this service")
            ->type_name("NAME");
        show.add_option("--thread", shown->thread, "what this thread did")
            ->type_name("N")
            ->check(wholeNumberFrom(1, std::numeric_limits<std::int32_t>::max()));
        addSeconds(show, "--from", shown->from, "what was not before this time");
        addSeconds(show, "--to", shown->to, "what was not after this time");
        show.add_flag("--json", shown->asJson, "print JSON");
    }

    void addReplay() {
        const auto values = std::make_shared<ReplayArguments>();
        CLI::App& added = command<ReplayArguments>(
            app_, "replay", "Run the plug-in against a recording in the place of a device", values,
            [this](const ReplayArguments& parsed) { return runReplay(parsed, console_); });
        added.add_option("FILE", values->file, "the recording")->required();
        addPlugIn(added, values->plugIn);
        added.add_flag("--strict", values->isStrict,
                       "calls of different threads, too, come in the recorded order");
        added.add_flag("--json", values->asJson, "print JSON");
    }

    void addConvert(CLI::App& parent) {
        static const std::map<std::string, PropertyListFormat> kFormats = {
            {"xml", PropertyListFormat::Xml}, {"binary", PropertyListFormat::Binary}};
        const auto values = std::make_shared<ConvertArguments>();
        CLI::App& added = command<ConvertArguments>(
            parent, "convert", "Write a property list in another encoding", values,
            [this](const ConvertArguments& parsed) {
                return runPropertyListConvert(parsed, console_);
            });
        added.add_option("FILE", values->file, "the property list, or JSON; - is standard input")
            ->required();
        added
            .add_option_function<std::string>(
                "--to", [values](const std::string& name) { values->format = kFormats.at(name); },
                "the encoding to write")
            ->required()
            ->type_name("xml|binary")
            ->check(CLI::Validator(
                [](const std::string& given) {
                    return given == "json"
                               ? "json is none of xml, binary (plist show --json writes that)"
                               : oneOf({"xml", "binary"})(given);
                },
                ""));
        added.add_option("--out", values->output, "the file to write; else standard output");
        added.add_flag("--json", values->asJson, "tell of the file that is written as JSON");
    }

    struct ShellValues {
        std::string place;
        bool asJson = false;
    };

    void addShell() {
        const auto values = std::make_shared<ShellValues>();
        command<ShellValues>(
            app_, "completion", "Print the script that completes lines in a shell", values,
            [this](const ShellValues& parsed) { return runCompletion(parsed.place, console_); })
            .add_option("SHELL", values->place, "the shell: bash, zsh or fish")
            ->required()
            ->type_name("bash|zsh|fish")
            ->check(oneOf({"bash", "zsh", "fish"}));
        const auto pages = std::make_shared<ShellValues>();
        CLI::App& manual = command<ShellValues>(
            app_, "manual", "Write the pages of the manual, one for each command", pages,
            [this](const ShellValues& parsed) {
                return runManual(parsed.place,
                                 manualPages(commandTable(app_), kFooter, APPSYNC_VERSION),
                                 parsed.asJson, console_);
            });
        manual
            .add_option("FOLDER", pages->place, "the folder for the pages; made where it is none")
            ->required();
        manual.add_flag("--json", pages->asJson, "print JSON");
    }

    Console console_;
    CLI::App app_;
    std::function<int()> action_;
};

}  // namespace

int runCommandLine(std::vector<std::string> arguments, const Console& console) {
    return Commands(console).run(std::move(arguments));
}

}  // namespace appsync
