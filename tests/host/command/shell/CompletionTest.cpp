#include "host/command/shell/Completion.h"

#include <sstream>

#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

class Completion : public HostFixture {
  protected:
    /// What the command says to a shell, line by line.
    std::vector<std::string> linesOf(std::vector<std::string> words) {
        words.insert(words.begin(), {"complete", "--"});
        EXPECT_EQ(run(words), 0);
        EXPECT_EQ(err.str(), "");
        std::vector<std::string> lines;
        std::istringstream text(out.str());
        for (std::string line; std::getline(text, line);) lines.push_back(line);
        return lines;
    }
    /// The same without what describes the words.
    std::vector<std::string> wordsOf(const std::vector<std::string>& words) {
        std::vector<std::string> lines = linesOf(words);
        for (std::string& line : lines) line = line.substr(0, line.find('\t'));
        return lines;
    }
};

TEST_F(Completion, OfNothingIsEveryCommandWithItsDescription) {
    EXPECT_THAT(linesOf({""}),
                AllOf(Contains("sync\tBring the device in step with a folder of packages"),
                      Contains("package\tMake or look at application packages"),
                      Contains(testing::StartsWith("help\t")), Not(Contains(":files"))));
}

TEST_F(Completion, OfTheBeginningOfACommandIsThoseThatBeginSo) {
    EXPECT_THAT(wordsOf({"st"}), testing::UnorderedElementsAre("stage", "status", "store"));
    EXPECT_THAT(wordsOf({"package", ""}), ElementsAre("make", "show", "list", "verify"));
    EXPECT_THAT(wordsOf({"help", "pack"}), ElementsAre("package"));
    EXPECT_THAT(wordsOf({"help", "data", "pu"}), ElementsAre("pull", "push"));
}

TEST_F(Completion, OfADashIsTheOptionsThatAreNotThereYet) {
    EXPECT_THAT(wordsOf({"apps", "-"}), ElementsAre("--help", "--json"));
    EXPECT_THAT(wordsOf({"apps", "--json", "-"}), ElementsAre("--help"));
    EXPECT_THAT(wordsOf({"sync", "--remove", "com.a", "--re"}),
                ElementsAre("--remove", "--record"));
    EXPECT_THAT(wordsOf({"sync", "--plug"}), ElementsAre("--plug-in"));
}

TEST_F(Completion, OfAnArgumentIsItsKind) {
    EXPECT_THAT(wordsOf({"sync", ""}), ElementsAre(":devices"));
    EXPECT_THAT(wordsOf({"create", ""}), ElementsAre(":directories"));
    EXPECT_THAT(wordsOf({"sync", device, ""}), ElementsAre(":directories"));
    EXPECT_THAT(wordsOf({"screen", device, "p"}), ElementsAre(":files"));
    EXPECT_THAT(wordsOf({"package", "verify", "a.zip", "b"}), ElementsAre(":files"));
    EXPECT_THAT(wordsOf({"timeline", ""}), ElementsAre(":files"));
    EXPECT_THAT(wordsOf({"coordinator", device, "c"}), ElementsAre("create", "cancel"));
    EXPECT_THAT(wordsOf({"completion", ""}), ElementsAre("bash", "zsh", "fish"));
    EXPECT_THAT(wordsOf({"apps", device, ""}), ElementsAre("--help", "--json"));
}

TEST_F(Completion, OfAnOptionsValueIsItsKind) {
    EXPECT_THAT(wordsOf({"create", device, "--coordination", ""}), ElementsAre("on", "off"));
    EXPECT_THAT(wordsOf({"log", device, "--level", "d"}), ElementsAre("debug", "default"));
    EXPECT_THAT(wordsOf({"sync", device, library, "--plug-in", ""}), ElementsAre(":files"));
    EXPECT_THAT(wordsOf({"sync", device, library, "--wait", ""}), IsEmpty());
    EXPECT_THAT(wordsOf({"sync", "--wait", "5m", ""}), ElementsAre(":devices"));
    EXPECT_THAT(wordsOf({"sync", "--mirror", ""}), ElementsAre(":devices"));
}

TEST_F(Completion, OfAnIdentifierIsWhatIsOnTheDevice) {
    addPackage("com.example.one", "1");
    addPackage("com.example.two", "1");
    ASSERT_EQ(sync(), 0);
    EXPECT_THAT(wordsOf({"why", device, ""}), ElementsAre("com.example.one", "com.example.two"));
    EXPECT_THAT(wordsOf({"why", device, "com.example.t"}), ElementsAre("com.example.two"));
    EXPECT_THAT(wordsOf({"log", device, "--app", "com.example.o"}), ElementsAre("com.example.one"));
    EXPECT_THAT(wordsOf({"coordinator", device, "cancel", "x"}), IsEmpty());
}

TEST_F(Completion, OfASettingIsWhatIsNotSetYet) {
    EXPECT_THAT(wordsOf({"set", ""}), ElementsAre(":devices"));
    EXPECT_THAT(
        wordsOf({"set", device, ""}),
        ElementsAre("installation=yes", "installation=no", "installation=unset", "removal=yes",
                    "removal=no", "removal=unset", "coordination=on", "coordination=off"));
    EXPECT_THAT(wordsOf({"set", device, "coordination=of"}), ElementsAre("coordination=off"));
    EXPECT_THAT(wordsOf({"set", device, "installation=yes", "removal=no", ""}),
                ElementsAre("coordination=on", "coordination=off"));
}

TEST_F(Completion, WhereThereIsNoDeviceSaysNothing) {
    EXPECT_THAT(linesOf({"why", directory.path() + "/nowhere", ""}), IsEmpty());
    EXPECT_THAT(linesOf({"why", library, ""}), IsEmpty());
    EXPECT_THAT(linesOf({"log", "--app", ""}), IsEmpty());
}

TEST_F(Completion, OfALineThatCannotBeRightIsNothing) {
    EXPECT_THAT(wordsOf({"dance", "a"}), IsEmpty());
    EXPECT_THAT(wordsOf({"package", "dance", ""}), IsEmpty());
    EXPECT_THAT(wordsOf({}), Contains("sync"));
    EXPECT_THAT(wordsOf({"apps", "--", device, ""}), IsEmpty());
}

TEST_F(Completion, HasAScriptForEachShellOfTheHelp) {
    for (const char* shell : {"bash", "zsh", "fish"}) {
        EXPECT_EQ(run({"completion", shell}), 0);
        EXPECT_THAT(out.str(), AllOf(HasSubstr(std::string("appsync completion ") + shell),
                                     HasSubstr(" complete ")));
    }
    EXPECT_EQ(run({"completion", "csh"}), 2);
    EXPECT_THAT(err.str(), HasSubstr("csh is none of bash, zsh, fish"));
    EXPECT_EQ(completionScript("csh"), "");
}

}  // namespace
}  // namespace appsync
