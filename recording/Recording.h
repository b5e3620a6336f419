#pragma once

// recording: what crosses platform/ during a session, kept as lines of JSON
// (docs/recording-format.md). A `Recording` (this header) writes them to a `RecordingSink`;
// RecordingPlatform.h stands between the plug-in and any platform, RecordedClient.h between the
// host and the plug-in. RecordText.h is the form of values, with Anonymizer.h what becomes of names
// in an anonymous one. Standard library and platform/ only, so that it runs on a device.

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <unordered_set>
#include <utility>

#include "platform/Bytes.h"
#include "recording/Anonymizer.h"
#include "recording/LineBuffer.h"
#include "recording/RecordText.h"

namespace appsync {

class SyncHost;

/// The version of the form that recordings have.
inline constexpr int kRecordingVersion = 2;
/// That of the oldest ones that can still be read.
inline constexpr int kOldestRecordingVersion = 1;

/// Contents of up to so many bytes that the plug-in passes are kept; longer ones are named by size
/// and sum.
inline constexpr std::size_t kPassedContentLimit = 512;
/// The same for what the plug-in is answered with, which a replay has to answer again.
inline constexpr std::size_t kAnsweredContentLimit = std::size_t{1024} * 1024;
/// A recording names what the plug-in has passed so lately without keeping it.
inline constexpr std::size_t kRememberedContents = 16;

/// Takes the lines of a recording, whole and with their ends. What it has taken should outlast the
/// process however that ends: one write for each line does, or a file that is mapped into memory.
/// Called by one thread at a time.
class RecordingSink {
  public:
    virtual ~RecordingSink() = default;
    /// A line that cannot be kept is the sink's to tell of.
    virtual void write(std::string_view line) noexcept = 0;
};

/// How a recording is made.
struct RecordingOptions {
    /// Names are replaced, contents left out.
    bool isAnonymous = false;
    /// Nothing: the steady clock.
    std::function<std::chrono::nanoseconds()> clock{};
    /// What identifies the thread that runs. Nothing: the thread of the machine.
    std::function<const void*()> thread{};
};

/// The lines of one session; their order is that of the session. Callable on any thread. Held by
/// shared pointers: what the plug-in leaves on a queue may be looked at after the session. The sink
/// is used until `finish` alone.
class Recording : public std::enable_shared_from_this<Recording> {
  public:
    /// Writes the header.
    Recording(RecordingSink& sink, const SyncHost& host, const std::string& plugInVersion,
              RecordingOptions options = {});
    Recording(const Recording&) = delete;
    Recording& operator=(const Recording&) = delete;

    /// The number of an object or a work item that begins to be known.
    [[nodiscard]] std::uint64_t newNumber();
    [[nodiscard]] RecordText newText();
    /// Writes a record with these members, and when and by whom.
    void write(const RecordText& record);
    /// A call that this thread has written is over: writes that, where another thread has written
    /// since.
    void writeReturn();
    /// Writes that the session is over. What comes later is not written.
    void finish();

  private:
    [[nodiscard]] bool isKnown(ContentSum sum) const;
    [[nodiscard]] std::size_t numberOf(const void* thread);
    void writeLine(const void* thread, const RecordText& record);
    void addText(const RecordText& record);
    void addFormat(std::string_view format);
    void addContents(const RecordText& record);
    void remember(ContentSum sum);

    RecordingSink& sink_;
    RecordingOptions options_;
    Anonymizer anonymizer_;
    std::chrono::nanoseconds begin_;
    std::atomic<std::uint64_t> numbers_ = 0;
    std::mutex mutex_;
    // Guarded by mutex_.
    bool isOver_ = false;
    std::map<const void*, std::size_t> threads_;
    std::atomic<const void*> lastThread_ = nullptr;  // the one that wrote last; read without it
    std::unordered_set<ContentSum> kept_;
    std::deque<ContentSum> passed_;  // lately, by the plug-in
    std::map<std::string, std::size_t, std::less<>> formats_;
    LineBuffer line_;
};

/// The name of a call, "FileSystem.readFile", in one piece or two.
class CallName {
  public:
    CallName(const char* whole) : service_(whole) {}
    CallName(std::string_view whole) : service_(whole) {}
    /// `service` with the full stop.
    CallName(std::string_view service, std::string_view method)
        : service_(service), method_(method) {}

    [[nodiscard]] std::string_view service() const { return service_; }
    [[nodiscard]] std::string_view method() const { return method_; }

  private:
    std::string_view service_;
    std::string_view method_;
};

/// One call across platform/, written when it is answered, when it says so, or when this goes.
class CallRecord {
  public:
    /// `object` is the number of what is called; 0 for a service.
    template <typename... Arguments>
    CallRecord(Recording& recording, const CallName& call, std::uint64_t object,
               const Arguments&... arguments)
        : recording_(recording), text_(recording.newText()) {
        text_.member("call");
        text_.addName(call.service(), call.method());
        if (object != 0) {
            text_.member("on");
            text_.add(object);
        }
        if constexpr (sizeof...(arguments) > 0) {
            text_.member("a");
            text_.begin('[');
            (text_.add(arguments), ...);
            text_.end(']');
        }
    }
    CallRecord(const CallRecord&) = delete;
    CallRecord& operator=(const CallRecord&) = delete;
    ~CallRecord() {
        if (!isWritten_) recording_.write(text_);
    }

    /// Writes it without an answer.
    void announce() { write(); }
    /// Writes the answer, and gives it back.
    template <typename Answer>
    Answer answer(Answer result) {
        text_.answers(kAnsweredContentLimit);
        text_.member("r");
        text_.add(result);
        write();
        return result;
    }
    /// The same of contents that may be large and that nobody looks into.
    template <typename Answer>
    Answer shortAnswer(Answer result) {
        text_.answers(kPassedContentLimit);
        text_.member("r");
        text_.add(result);
        write();
        return result;
    }

  private:
    void write() {
        isWritten_ = true;
        recording_.write(text_);
    }

    Recording& recording_;
    RecordText text_;
    bool isWritten_ = false;
};

/// A call that lets others go on before it is over: written when this is made. What they have done
/// when it is over comes before what the plug-in does next, so that is written then.
class AnnouncedCall {
  public:
    template <typename... Arguments>
    AnnouncedCall(Recording& recording, const CallName& call, std::uint64_t object,
                  const Arguments&... arguments)
        : recording_(recording) {
        CallRecord(recording, call, object, arguments...).announce();
    }
    AnnouncedCall(const AnnouncedCall&) = delete;
    AnnouncedCall& operator=(const AnnouncedCall&) = delete;
    ~AnnouncedCall() { recording_.writeReturn(); }

  private:
    Recording& recording_;
};

/// A stretch of time in which one thread does what somebody asked for: a call of the host, a work
/// item, a callback. Its end is written when it is answered or this goes.
class SpanRecord {
  public:
    /// `kind` is "host", "run", "callback", "walk" or "each".
    template <typename... Arguments>
    SpanRecord(Recording& recording, std::string_view kind, std::string_view name,
               std::uint64_t object, const Arguments&... arguments)
        : recording_(recording) {
        RecordText text = recording_.newText();
        text.member(kind);
        text.addName(name);
        if (object != 0) {
            text.member("on");
            text.add(object);
        }
        if constexpr (sizeof...(arguments) > 0) {
            text.member("a");
            text.begin('[');
            (text.add(arguments), ...);
            text.end(']');
        }
        recording_.write(text);
    }
    SpanRecord(const SpanRecord&) = delete;
    SpanRecord& operator=(const SpanRecord&) = delete;
    ~SpanRecord() {
        if (!isWritten_) end(nullptr);
    }

    /// Writes the end with this answer, and gives it back.
    template <typename Answer>
    Answer answer(Answer result) {
        RecordText text = recording_.newText();
        text.answers(kPassedContentLimit);
        text.add(result);
        end(&text);
        return result;
    }
    /// Writes the end; the answer was written down already, null where there is none.
    void end(const RecordText* answer);

  private:
    Recording& recording_;
    bool isWritten_ = false;
};

}  // namespace appsync
