#include "host/command/CommandLine.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <optional>
#include <sstream>

#include "host/console/Console.h"

namespace appsync {
namespace {

using testing::EndsWith;
using testing::HasSubstr;
using testing::StartsWith;

class CommandLine : public testing::Test {
  protected:
    int run(std::vector<std::string> arguments) {
        return runCommandLine(std::move(arguments), console);
    }

    std::ostringstream out;
    std::ostringstream err;
    Console console{out, err, false, 80};
};

struct WrongUsage {
    std::vector<std::string> arguments;
    std::string complaint;
    /// Whose help is named; nothing: that of the command that the first arguments are.
    std::optional<std::string> command = std::nullopt;
};

std::string commandOf(const WrongUsage& wrong) {
    if (wrong.command) return *wrong.command;
    const std::string& first = wrong.arguments.front();
    const bool isGroup = first == "package" || first == "plist" || first == "data";
    return isGroup ? first + " " + wrong.arguments.at(1) : first;
}

std::string pointerTo(const std::string& command) {
    return "see appsync " + command + (command.empty() ? "" : " ") + "--help\n";
}

class WrongCommandLine : public CommandLine, public testing::WithParamInterface<WrongUsage> {};

TEST_P(WrongCommandLine, IsRefusedWithOneLineAndStatus2) {
    EXPECT_EQ(run(GetParam().arguments), 2);
    EXPECT_THAT(err.str(), StartsWith("appsync: "));
    EXPECT_THAT(err.str(), HasSubstr(GetParam().complaint));
    EXPECT_THAT(err.str(), EndsWith(pointerTo(commandOf(GetParam()))));
    EXPECT_EQ(err.str().find('\n'), err.str().size() - 1);
    EXPECT_EQ(out.str(), "");
}

INSTANTIATE_TEST_SUITE_P(
    Usage, WrongCommandLine,
    testing::Values(
        WrongUsage{{}, "appsync needs a command: see appsync --help", ""},
        WrongUsage{{"dance"}, "there is no command dance: see", ""},
        WrongUsage{{"sync", "device"}, "LIBRARY"},
        WrongUsage{{"sync", "device", "library", "--json", "--json-lines"}, "--json"},
        WrongUsage{{"sync", "device", "library", "--staged", "--mirror"}, "--staged"},
        WrongUsage{{"sync", "device", "library", "--remove", "a/b"}, "--remove a/b is not"},
        WrongUsage{{"stage", "device", "library", "--remove", "a/b"}, "--remove a/b is not"},
        WrongUsage{{"stage", "device", "library", "--staged"}, "--staged is not an option"},
        WrongUsage{{"create", "device", "--coordination", "maybe"}, "on"},
        WrongUsage{{"create", "device", "--coordination", "perhaps"}, "perhaps"},
        WrongUsage{{"set", "device", "coordination=maybe"}, "use on or off"},
        WrongUsage{{"coordinator", "device", "create"}, "needs an identifier"},
        WrongUsage{{"coordinator", "device", "create", "com.a", "--client", "3"}, "plug-in"},
        WrongUsage{{"coordinator", "device", "list", "com.a"}, "takes no identifier"},
        WrongUsage{{"set", "device", "installation=maybe"}, "use yes, no or unset"},
        WrongUsage{{"set", "device", "colour=red"}, "no setting colour"},
        WrongUsage{{"run", "device", "not/legal"}, "not an identifier"},
        WrongUsage{{"why", "device", "../x"}, "../x is not an identifier"},
        WrongUsage{{"why", "device", ""}, "'' is not an identifier"},
        WrongUsage{{"send", "device", "a b", "file"}, "a b is not an identifier"},
        WrongUsage{{"coordinator", "device", "cancel", "a/b"}, "a/b is not an identifier"},
        WrongUsage{{"log", "device", "--level", "loud"}, "loud"},
        WrongUsage{{"send", "device", "com.a", "file", "--parts", "2"}, "without --restore"},
        WrongUsage{{"send", "device", "com.a", "file", "--restore", "--parts", "4"},
                   "--parts: 4 is no whole number from 1 to 3: see appsync send --help"},
        WrongUsage{{"coordinator", "device", "dance"}, "dance"},
        WrongUsage{{"plist", "convert", "file", "--to", "json"},
                   "--to: json is none of xml, binary"},
        WrongUsage{
            {"package"}, "appsync package needs a command: see appsync package --help", "package"},
        WrongUsage{{"log", "device", "--category", "x"},
                   "--category: x is no whole number from 0 to 1000000: see appsync log --help"},
        WrongUsage{{"log", "device", "--category", ""}, "--category: '' is no whole number"},
        WrongUsage{{"coordinator", "device", "create", "com.a", "--client", "0"},
                   "--client: 0 is no whole number from 1 to 1000000"},
        WrongUsage{{"restore", "device", "backup", "--type", "two"},
                   "--type: two is no whole number: see appsync restore --help"},
        WrongUsage{{"demote", "device", "com.a", "--by"},
                   "--by needs a value: see appsync demote --help"},
        WrongUsage{{"replay", "file", "--plug-in", "a", "--plug-in", "b"},
                   "--plug-in is given more than once: see appsync replay --help"},
        WrongUsage{{"sync", "device", "library", "--version"},
                   "--version is not an option of appsync sync: see appsync sync --help"},
        WrongUsage{{"set", "device", ""}, "there is no setting ''"},
        WrongUsage{{"set", "device", "removal="}, "removal cannot be '': use yes, no or unset"},
        WrongUsage{{"plist", "convert", "-", "--to", "xml", "--json"}, "name one with --out"},
        WrongUsage{{"plist", "convert", "file", "--to", "0"}, "--to: 0 is none of xml, binary"},
        WrongUsage{{"log", "device", "--level", "2"}, "2 is none of debug, info, default"},
        WrongUsage{{"demote", "device", "com.a", "--by", "me"}, "me is none of person, system"},
        WrongUsage{{"demote", "device", "com.a", "--by", ""}, "'' is none of person, system"},
        WrongUsage{{"--verbose"}, "--verbose is not an option of appsync: see appsync --help", ""},
        WrongUsage{
            {"apps", "--jsn"},
            "--jsn is not an option of appsync apps: try --json, or see appsync apps --help"},
        WrongUsage{{"apps", "device", "too", "many"},
                   "too is one argument too many for appsync apps: see appsync apps --help"},
        WrongUsage{{"apps"}, "DEVICE is required: see appsync apps --help"},
        WrongUsage{{"package", "make", "folder"},
                   "OUT is required: see appsync package make --help"},
        WrongUsage{{"data", "pull", "device", "a/b", "out"}, "a/b is not an identifier"},
        WrongUsage{{"data", "push", "device", "com.a"}, "FROM is required"},
        WrongUsage{{""}, "there is no command ''", ""},
        WrongUsage{{"help", "dance"}, "there is no command dance", ""},
        WrongUsage{{"device", "apps"}, "no command device: the command comes first, see", ""},
        WrongUsage{{"help", "package", "dance"}, "no command dance of appsync package", "package"},
        WrongUsage{{"help", "sync", "extra"}, "no command extra of appsync sync", "sync"},
        WrongUsage{{"data", "dance"}, "there is no command dance of appsync data: see", "data"},
        WrongUsage{{"plist", "shw", "file"}, "no command shw of appsync plist: try show", "plist"},
        WrongUsage{{"snyc", "device", "library"}, "there is no command snyc: try sync, or", ""},
        WrongUsage{{"sync", "device", "library", "--mirorr=empty"}, "try --mirror, or see"},
        WrongUsage{{"backup", "device", "--check", "backup"}, "DEVICE does not go with --check"},
        WrongUsage{{"backup", "device"}, "backup needs DEVICE and BACKUP, or --check BACKUP"},
        WrongUsage{{"log", "device", "--last", "0"}, "--last: 0 is no whole number from 1"},
        WrongUsage{{"apps", "device", "--json=false"}, "--json takes no value: see"},
        WrongUsage{{"apps", "device", "--json=perhaps"}, "--json takes no value: see"},
        WrongUsage{{"sync", "device", "library", "--no-wait=1"}, "--no-wait takes no value"},
        WrongUsage{{"set", "device", "removal=yes", "coordination=on", "removal=no"},
                   "both removal=yes and removal=no are given: choose one"},
        WrongUsage{{"coordinator", "list", "device"},
                   "DEVICE comes before list: try appsync coordinator DEVICE list, or see appsync"},
        WrongUsage{{"coordinator", "cancel", "device", "com.a"},
                   "DEVICE comes before cancel: try appsync coordinator DEVICE cancel ID, or see"},
        WrongUsage{{"coordinator", "list"}, "DEVICE comes before list: try"},
        WrongUsage{{"coordinator", "device", "lost"}, "lost is none of list, create, cancel"},
        WrongUsage{{"create", ""}, "cannot create a device at ''"},
        WrongUsage{{"set", "device", "coordination"},
                   "coordination has no value: use coordination="},
        WrongUsage{{"stage", "device", "library", "--only", "com.a", "--mirror"}, "--mirror"},
        WrongUsage{{"sync", "device", "library", "--mirror=all"}, "--mirror=empty"},
        WrongUsage{{"sync", "device", "library", "--only", "a/b"}, "--only a/b is not"},
        WrongUsage{{"sync", "device", "library", "--only", "com.a", "--staged"}, "--staged"},
        WrongUsage{{"sync", "device", "library", "--only", "com.a", "--mirror"}, "--mirror"},
        WrongUsage{{"sync", "device", "library", "--only", "com.a", "--remove", "com.a"},
                   "com.a is named by --only and by --remove"},
        WrongUsage{{"plan", "device", "library", "--only", "com.a", "com.b"},
                   "com.b is one argument too many for appsync plan"},
        WrongUsage{{"sync", "device", "library", "--wait", "1m", "--no-wait"}, "--no-wait"},
        WrongUsage{{"sync", "device", "library", "--wait", "soon"}, "soon is no time"},
        WrongUsage{{"sync", "device", "library", "--wait", "-5"}, "-5 is no time"},
        WrongUsage{{"sync", "device", "library", "--wait", "s"}, "s is no time"},
        WrongUsage{{"sync", "device", "library", "--wait", "9000h"}, "9000h is no time"},
        WrongUsage{{"sync", "device", "library", "--wait", "9223372036854775807m"}, "is no time"},
        // An empty value is none, and takes no other word in its place.
        WrongUsage{{"sync", "device", "library", "--remove=", "com.a"},
                   "--remove needs another value than '': see appsync sync --help"},
        WrongUsage{{"sync", "device", "library", "--mirror="}, "--mirror needs another value"},
        WrongUsage{{"sync", "device", "library", "--remove", ""},
                   "--remove: it needs another value than ''"},
        WrongUsage{{"plist", "convert", "file", "--to=", "xml"},
                   "--to needs another value than '': see appsync plist convert --help"},
        // One identifier for each --remove: what follows is an argument of the command.
        WrongUsage{{"sync", "device", "library", "--remove", "com.a", "com.b"},
                   "com.b is one argument too many for appsync sync"}));

class EachCommand : public CommandLine, public testing::WithParamInterface<std::string> {};

TEST_P(EachCommand, HasHelp) {
    std::vector<std::string> arguments;
    std::istringstream words(GetParam());
    for (std::string word; words >> word;) arguments.push_back(word);
    arguments.emplace_back("--help");
    EXPECT_EQ(run(arguments), 0);
    EXPECT_THAT(out.str(), HasSubstr("Usage: "));
    EXPECT_EQ(err.str(), "");
    std::istringstream lines(out.str());
    for (std::string line; std::getline(lines, line);) EXPECT_LT(line.size(), 80U) << line;
}

TEST_P(EachCommand, IsUsedWronglyWithoutArgumentsAndWithAnUnknownOption) {
    std::vector<std::string> arguments;
    std::istringstream words(GetParam());
    for (std::string word; words >> word;) arguments.push_back(word);
    EXPECT_EQ(run(arguments), 2);
    EXPECT_THAT(err.str(), EndsWith(pointerTo(GetParam())));
    err.str("");
    arguments.emplace_back("--unheard-of");
    EXPECT_EQ(run(arguments), 2);
    EXPECT_THAT(err.str(), HasSubstr("--unheard-of is not an option of appsync"));
    EXPECT_THAT(err.str(), EndsWith(pointerTo(GetParam())));
    EXPECT_EQ(out.str(), "");
}

INSTANTIATE_TEST_SUITE_P(Help, EachCommand,
                         testing::Values("", "create", "sync", "plan", "stage", "apps", "screen",
                                         "why", "inventory", "set", "run", "quit", "uninstall",
                                         "reset", "rollback", "log", "history", "status",
                                         "coordinator", "demote", "backup", "restore", "store",
                                         "send", "package", "package make", "package show", "plist",
                                         "plist show", "plist convert"));

INSTANTIATE_TEST_SUITE_P(HelpWithoutASession, EachCommand,
                         testing::Values("completion", "manual", "package list", "package verify",
                                         "data", "data ls", "data pull", "data push", "diff",
                                         "timeline"));

TEST_F(CommandLine, HelpShowsTheHelpOfACommand) {
    EXPECT_EQ(run({"help", "package", "make"}), 0);
    const std::string shown = out.str();
    out.str("");
    EXPECT_EQ(run({"package", "make", "--help"}), 0);
    EXPECT_EQ(shown, out.str());
    EXPECT_THAT(shown, HasSubstr("OUT"));
}

TEST_F(CommandLine, WhatFollowsTheIdentifierToRemoveIsTheDeviceAndTheLibrary) {
    EXPECT_EQ(run({"plan", "--remove", "com.a", "/nonexistent/device", "library"}), 3);
    EXPECT_THAT(err.str(), HasSubstr("/nonexistent/device"));
}

TEST_F(CommandLine, TellsItsVersionInOneLine) {
    EXPECT_EQ(run({"--version"}), 0);
    EXPECT_THAT(out.str(),
                testing::MatchesRegex(
                    "appsync [0-9]+\\.[0-9]+\\.[0-9]+, module interface [0-9]+\\.[0-9]+\n"));
    EXPECT_EQ(err.str(), "");
}

TEST_F(CommandLine, NothingFollowsTheVersion) {
    EXPECT_EQ(run({"--version", "x"}), 2);
    EXPECT_EQ(out.str(), "");
    EXPECT_EQ(err.str(),
              "appsync: x is one argument too many for appsync --version: see appsync --help\n");
    EXPECT_EQ(run({"--version", "apps", "device"}), 2);
}

TEST_F(CommandLine, ATimeIsSecondsMinutesOrHours) {
    for (const char* time : {"0", "90", "90s", "5m", "8760h"}) {
        EXPECT_EQ(run({"sync", "/nonexistent/device", "library", "--wait", time}), 3) << time;
    }
}

TEST_F(CommandLine, ADeviceThatIsMissingIsStatus3) {
    EXPECT_EQ(run({"apps", "/nonexistent/device"}), 3);
    EXPECT_THAT(err.str(), HasSubstr("/nonexistent/device"));
}

}  // namespace
}  // namespace appsync
