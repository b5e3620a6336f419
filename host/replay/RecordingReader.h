#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <nlohmann/json.hpp>

#include "platform/Bytes.h"
#include "platform/Result.h"
#include "recording/RecordText.h"

namespace appsync {

/// What a line of a recording tells of.
enum class RecordKind {
    Call,      // of the plug-in, with its answer where it has one
    Host,      // the host begins to call the plug-in
    Run,       // an item of work begins
    Callback,  // a service begins to call the plug-in
    Walk,      // a call of the plug-in that is answered piece by piece begins
    Each,      // a piece of it
    Back,      // the call that the same thread has made last is over, after what others did
    End,       // of the stretch that the same thread has begun last
    Finished,  // of the session
};

/// One line.
struct RecordLine {
    std::chrono::nanoseconds time{0};
    std::uint64_t thread = 0;
    RecordKind kind = RecordKind::Call;
    /// "FileSystem.readFile"; of a host's call "reconcileSync".
    std::string name;
    /// What is called, or the item; 0 for a service.
    std::uint64_t object = 0;
    nlohmann::json arguments = nlohmann::json::array();
    /// Null also where there is none.
    nlohmann::json answer;
    /// Of the stretch that it belongs to, as an index of `RecordedSession::stretches`.
    std::size_t stretch = 0;
    /// Of one that begins a stretch, that stretch.
    std::size_t begins = 0;
};

/// What one thread does from a beginning to its end, in order: calls and pieces, then the end,
/// unless the recording is cut off there.
struct RecordStretch {
    std::size_t beginning = 0;
    std::vector<std::size_t> lines;
};

/// A recording as it was read: each line is what it may be in its place.
struct RecordedSession {
    std::string plugInVersion;
    std::string process;
    std::string bundle;
    bool isAnonymous = false;
    /// The session went on when the last line was written.
    bool isCutOff = true;
    std::vector<RecordLine> lines;
    std::vector<RecordStretch> stretches;
    /// Where each item of work runs, by its number.
    std::map<std::uint64_t, std::size_t> runs;
    std::map<ContentSum, Bytes> contents;
};

/// Reads a recording, whoever wrote it. An error of exit status 3 says which line is none, and why.
/// A last line without an end was being written when the process ended: it is left out.
[[nodiscard]] Result<RecordedSession> readRecording(std::string_view text);
/// The same of a file of this machine.
[[nodiscard]] Result<RecordedSession> readRecordingFile(const std::string& path);

/// The bytes of a text in a record: itself, or {"bytes": base 64}.
[[nodiscard]] std::optional<std::string> textIn(const nlohmann::json& value);

}  // namespace appsync
