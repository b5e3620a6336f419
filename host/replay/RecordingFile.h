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

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Result.h"
#include "recording/Recording.h"
#include "system/file/UniqueFd.h"

namespace appsync {

struct Console;

/// A file that a session is recorded in. It grows by pieces that are mapped into memory: what is
/// written there is in the file at once, so that the end of the process, however it comes, takes
/// the last line at most, and no line costs a call of the system. What is left of the last piece
/// goes with this; of a process that was killed it stays, zeros behind the last line. Where a file
/// system has no such pieces, each line is one write.
///
/// Nobody else may shorten the file meanwhile.
class RecordingFile : public RecordingSink {
  public:
    /// Makes the file. One that holds something already is refused: it may be the recording that
    /// somebody still wants to look at.
    [[nodiscard]] static Result<std::unique_ptr<RecordingFile>> create(const std::string& path);
    RecordingFile(std::string path, UniqueFd file);
    RecordingFile(const RecordingFile&) = delete;
    RecordingFile& operator=(const RecordingFile&) = delete;
    /// Of a session that never began nothing stays.
    ~RecordingFile() override;

    void write(std::string_view line) noexcept override;

    /// Says it on the console when something could not be written.
    void tellLoss(const Console& console) const;

  private:
    [[nodiscard]] int append(std::string_view text) noexcept;
    [[nodiscard]] int nextPiece() noexcept;
    void leavePiece() noexcept;
    [[nodiscard]] int writeMapped(std::string_view line) noexcept;

    const std::string path_;
    const UniqueFd file_;
    bool isEmpty_ = true;
    bool isMapped_ = true;
    char* piece_ = nullptr;          // the one that is written
    std::uint64_t pieceOffset_ = 0;  // where it begins in the file
    std::size_t used_ = 0;           // of it
    int lossError_ = 0;              // the errno value of the first failure
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
