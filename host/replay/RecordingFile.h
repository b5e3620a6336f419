#pragma once

// host/replay: recordings of sessions (docs/recording-format.md), written and read back.
//
//     RecordingFile.h      the file that a session is written to
//     RecordingReader.h    reads one, whoever has written it
//     RecordingText.h      shows its lines
//     Replay.h             runs a plug-in against one
//
// Called by the commands. Includes recording/, the scheduler of simulation/ and the codec of
// property lists; knows neither devices nor plans.

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Result.h"
#include "recording/Recording.h"
#include "system/UniqueFd.h"

namespace appsync {

struct Console;

/// A file that a session is recorded in: each line is one write to its end, so that the end of the
/// process, however it comes, takes the last one at most.
class RecordingFile : public RecordingSink {
  public:
    /// Makes the file. One that holds something already is refused: it may be the recording that
    /// somebody still wants to look at.
    [[nodiscard]] static Result<std::unique_ptr<RecordingFile>> create(const std::string& path);
    RecordingFile(std::string path, UniqueFd file)
        : path_(std::move(path)), file_(std::move(file)) {}
    RecordingFile(const RecordingFile&) = delete;
    RecordingFile& operator=(const RecordingFile&) = delete;
    /// Of a session that never began nothing stays.
    ~RecordingFile() override;

    void write(std::string_view line) noexcept override;

    /// Says it on the console when something could not be written.
    void tellLoss(const Console& console) const;

  private:
    const std::string path_;
    const UniqueFd file_;
    bool isEmpty_ = true;
    int lossError_ = 0;  // the errno value of the first failure
};

/// What `sync`, `restore` and `send` are told of it.
struct RecordingArguments {
    /// Empty: the session is not recorded.
    std::string path{};
    bool isAnonymous = false;
};

/// The file that the arguments ask for; null when they ask for none.
[[nodiscard]] Result<std::unique_ptr<RecordingFile>> createRecording(
    const RecordingArguments& arguments);

}  // namespace appsync
