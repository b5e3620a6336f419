#include <ostream>

#include <nlohmann/json.hpp>

#include "host/command/file/FileCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/module/PlugInModule.h"
#include "host/replay/RecordingReader.h"
#include "host/replay/Replay.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

Json jsonOf(const Divergence& divergence) {
    return {{"thread", divergence.thread},
            {"expected", divergence.expected},
            {"came", divergence.came},
            {"before", divergence.before}};
}

void printDivergence(const Divergence& divergence, const Console& console) {
    console.out << "thread " << divergence.thread << " did something else\n"
                << "expected: " << printable(divergence.expected) << '\n'
                << "came:     " << printable(divergence.came) << '\n'
                << "before, on that thread:\n";
    for (const std::string& each : divergence.before) {
        console.out << "  " << printable(each) << '\n';
    }
}

void printOutcome(const RecordedSession& session, const ReplayOutcome& outcome,
                  const Console& console) {
    if (outcome.divergence) printDivergence(*outcome.divergence, console);
    console.out << counted(outcome.lines, "line") << " of " << session.lines.size() << " replayed"
                << (outcome.divergence ? "" : " without a divergence")
                << (session.isCutOff ? "; the recording is cut off there\n" : "\n");
}

}  // namespace

int runReplay(const ReplayArguments& arguments, const Console& console) {
    const Result<PlugInModule> build = PlugInModule::open(arguments.plugIn);
    if (!build) return console.fail(build.error());
    const Result<RecordedSession> session = readRecordingFile(arguments.file);
    if (!session) return console.fail(session.error());
    const Result<ReplayOutcome> outcome = replay(*session, build->table(), arguments.isStrict);
    if (!outcome) return console.fail(outcome.error());
    if (outcome->damage) return console.fail(*outcome->damage);
    if (arguments.asJson) {
        console.out << indented({{"lines", outcome->lines},
                                 {"of", session->lines.size()},
                                 {"cutOff", session->isCutOff},
                                 {"divergence",
                                  outcome->divergence ? jsonOf(*outcome->divergence) : Json()}})
                    << '\n';
    } else {
        printOutcome(*session, *outcome, console);
    }
    return outcome->divergence ? kExitSomethingFailed : kExitDone;
}

}  // namespace appsync
