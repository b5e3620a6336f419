#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "host/timeline/Timeline.h"

namespace appsync {

/// What a message tells of.
enum class TimelineEventKind {
    // Of the session.
    SyncBegins,
    RestoreBegins,
    ReconciliationEnds,
    InventoryBegins,
    AskingBegins,
    RegistryAsked,
    RegistryAnswered,
    PlaceholdersAwaited,
    PlaceholdersThere,
    TransfersEnd,
    SessionEnds,
    // Of one application.
    Asked,           // with its name and version
    DeliveryBegins,  // the host sends it unasked, in a session of its own
    Skipped,
    PlaceholderBegins,
    PlaceholderEnds,
    PlaceholderFails,
    TransferGoesOn,
    TransferEnds,
    InstallQueued,
    InstallBegins,
    TerminationDenied,
    InstallEnds,
    StoreAwaited,
    Cancelled,
    RemovalBegins,
    RemovalEnds,
};

[[nodiscard]] bool isOfSession(TimelineEventKind kind);

/// Something that happened.
struct TimelineEvent {
    TimelineEventKind kind = TimelineEventKind::SyncBegins;
    TimelineMoment at{0};
    std::string identifier{};
    /// Why it was skipped, failed or was cancelled; empty where it went well. Of what is asked for
    /// the name.
    std::string detail{};
    std::string version{};
    std::uint64_t thread = 0;
};

/// The same with the time of day, where that is known.
struct TimedEvent {
    std::chrono::system_clock::time_point time;
    TimelineEvent event;
};

/// Which of a message's arguments say what; the first is whose message it is.
struct TimelineMessage {
    std::string_view format;
    TimelineEventKind kind;
    int identifier = 0;  // 0: it has none
    int detail = 0;
    int version = 0;
    /// Says whether it went well: "y" or 1. 0: the detail does.
    int success = 0;
    /// What the detail is where no argument says it.
    std::string_view reason{};
};

/// What a message of that format tells of; null where it is of no interest here.
[[nodiscard]] const TimelineMessage* messageOfFormat(std::string_view format);

/// The event that a message with these arguments tells of; at time 0.
[[nodiscard]] TimelineEvent eventOfMessage(const TimelineMessage& message,
                                           const std::vector<std::string>& arguments);

/// The arguments that were rendered into a message, found again by the texts between them. Fewer
/// where the message is not of that format.
[[nodiscard]] std::vector<std::string> argumentsOfMessage(std::string_view format,
                                                          std::string_view message);

}  // namespace appsync
