#include "host/command/shell/ManualPages.h"

#include <filesystem>
#include <fstream>
#include <iterator>

#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;

class Manual : public HostFixture {
  protected:
    std::string page(const std::string& name) {
        std::ifstream file(directory.path() + "/man/" + name);
        return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
    }
};

TEST_F(Manual, HasAPageForEachCommand) {
    ASSERT_EQ(run({"manual", directory.path() + "/man"}), 0) << err.str();
    EXPECT_THAT(page("appsync.1"), AllOf(HasSubstr(".TH APPSYNC 1"),
                                         HasSubstr("\\fBappsync package\\fR\nMake or look at")));
    EXPECT_THAT(page("appsync-package-make.1"),
                AllOf(HasSubstr("\\fBappsync package make\\fR [\\fB\\-\\-json\\fR] "
                                "\\fIFOLDER\\fR \\fIOUT\\fR\n"),
                      HasSubstr(".TP\n\\fIOUT\\fR\nthe package to write\n")));
    EXPECT_THAT(page("appsync-sync.1"),
                AllOf(HasSubstr("[\\fB\\-\\-remove\\fR \\fIID\\fR]..."),
                      HasSubstr("\\fB\\-\\-mirror\\fR[=empty]"), Not(HasSubstr("TEXT"))));
    for (const auto& file : std::filesystem::directory_iterator(directory.path() + "/man")) {
        EXPECT_THAT(page(file.path().filename().string()), HasSubstr(".SH SYNOPSIS"));
    }
}

TEST_F(Manual, LeadsToThePagesOfWhatACommandTakes) {
    const std::string ofDevice = "\\fBappsync\\-device\\fR(5)";
    const std::string ofBackup = "\\fBappsync\\-backup\\fR(5)";
    ASSERT_EQ(run({"manual", directory.path() + "/man"}), 0) << err.str();
    EXPECT_THAT(page("appsync.1"), AllOf(HasSubstr(ofDevice), HasSubstr(ofBackup)));
    EXPECT_THAT(page("appsync-restore.1"), AllOf(HasSubstr(ofDevice), HasSubstr(ofBackup)));
    EXPECT_THAT(page("appsync-apps.1"), AllOf(HasSubstr(ofDevice), Not(HasSubstr(ofBackup))));
    EXPECT_THAT(page("appsync-plist-show.1"),
                AllOf(HasSubstr(".SH SEE ALSO\n\\fBappsync\\fR(1)\n"), Not(HasSubstr(ofDevice))));
}

TEST_F(Manual, PrintsWhatIsATroffRequestAsItIs) {
    const CommandEntry program{"p", ".so \\n", {{"F", "'x\n.y", "", true, true, true}}, {}};
    const std::vector<ManualPage> pages = manualPages(program, ".end", "1");
    ASSERT_THAT(pages, SizeIs(1));
    EXPECT_EQ(pages[0].file, "p.1");
    EXPECT_THAT(pages[0].text,
                AllOf(HasSubstr("p \\- \\&.so \\en\n"), HasSubstr("\n\\&'x\n\\&.y\n"),
                      HasSubstr("\n\\&.end\n"), HasSubstr("\\fBp\\fR \\fIF\\fR...\n")));
}

TEST_F(Manual, ThatCannotBeWrittenSaysSo) {
    write(directory.path() + "/file", "");
    EXPECT_EQ(run({"manual", directory.path() + "/file/man"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("cannot make "));
    EXPECT_EQ(run({"manual", directory.path() + "/file"}), 1);
    EXPECT_NE(err.str(), "");
}

}  // namespace
}  // namespace appsync
