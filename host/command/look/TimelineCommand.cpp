#include <array>
#include <filesystem>
#include <functional>
#include <ostream>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/Device.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/argument/WrittenFile.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/replay/RecordingReader.h"
#include "host/timeline/TimelineOfDevice.h"
#include "host/timeline/TimelineOfRecording.h"
#include "host/timeline/TimelinePage.h"
#include "host/timeline/TimelinePng.h"
#include "host/timeline/TimelineSvg.h"

namespace appsync {
namespace {

Bytes bytesOf(const std::string& text) { return {text.begin(), text.end()}; }

Result<Bytes> svgFile(const Timeline& timeline) { return bytesOf(timelineSvg(timeline)); }
Result<Bytes> pageFile(const Timeline& timeline) { return bytesOf(timelinePage(timeline)); }

using PictureWriter = Result<Bytes> (*)(const Timeline&);
constexpr std::array<std::pair<std::string_view, PictureWriter>, 3> kPictureWriters = {
    {{".svg", svgFile}, {".png", timelinePng}, {".html", pageFile}}};

Result<PictureWriter> writerFor(const std::string& file) {
    for (const auto& [ending, writer] : kPictureWriters) {
        if (file.size() > ending.size() && file.ends_with(ending)) return writer;
    }
    return wrongUsage("--out " + file + " is no picture that can be drawn",
                      "give a FILE that ends in .svg, .png or .html");
}

std::string fileNameOf(const std::string& path) {
    std::string_view rest = path;
    while (rest.size() > 1 && rest.ends_with('/')) rest.remove_suffix(1);
    const std::string name = std::filesystem::path(rest).filename().string();
    return name.empty() || name == "." || name == ".." ? path : name;
}

Result<Timeline> timelineIn(const TimelineArguments& arguments) {
    std::error_code code;
    const std::filesystem::file_type type = std::filesystem::status(arguments.source, code).type();
    if (type == std::filesystem::file_type::not_found) {
        return unusable("there is neither a device nor a recording at '" + arguments.source + "'",
                        "give the path of one");
    }
    if (type != std::filesystem::file_type::directory) {
        if (arguments.session) {
            return wrongUsage("--session with a recording", "a recording holds one session");
        }
        const Result<RecordedSession> session = readRecordingFile(arguments.source);
        if (!session) return session.error();
        return timelineOfRecording(*session, fileNameOf(arguments.source));
    }
    const auto device = openDevice(arguments.source, DeviceAccess::Look);
    if (!device) return device.error();
    Result<Timeline> timeline = timelineOfDevice(
        **device, fileNameOf(arguments.source),
        {.session = arguments.session.value_or(1), .now = std::chrono::system_clock::now()});
    if (!timeline) return classified(timeline.error());
    return timeline;
}

Status drawTimeline(const TimelineArguments& arguments, const Console& console) {
    const Result<PictureWriter> writer = writerFor(arguments.picture);
    if (!writer) return writer.error();
    const Result<Timeline> timeline = timelineIn(arguments);
    if (!timeline) return timeline.error();
    const Result<Bytes> picture = (*writer)(*timeline);
    if (!picture) return picture.error();
    const Result<WrittenFile> written = writeOutput(arguments.picture, *picture);
    if (!written) return written.error();
    tellWritten(*written, arguments.asJson, console);
    if (arguments.asJson) return {};
    if (timeline->isEmpty()) console.out << "No session yet.\n";
    for (const std::string& note : timeline->notes) console.out << note << '\n';
    return {};
}

}  // namespace

int runTimeline(const TimelineArguments& arguments, const Console& console) {
    const Status drawn = drawTimeline(arguments, console);
    return drawn ? kExitDone : console.fail(drawn.error());
}

}  // namespace appsync
