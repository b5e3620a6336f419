#pragma once

#include <memory>
#include <string>
#include <vector>

#include "host/session/SyncEvents.h"

namespace appsync {

struct Console;

enum class SyncDisplayKind { Text, Json, JsonLines };

/// The display that suits: for people bars on a terminal, else a line per event; for programs one
/// object at the end, or one per event. The console must outlive it.
[[nodiscard]] std::unique_ptr<SyncDisplay> makeSyncDisplay(SyncDisplayKind kind,
                                                           const Console& console);

/// One line about an event, without line end: "transfer com.example.atlas: 50 % (1.0 MiB of 2.0
/// MiB)".
[[nodiscard]] std::string eventLine(const SyncEvent& event);

/// The bar of an event, at most `width` characters.
[[nodiscard]] std::string eventBar(const SyncEvent& event, std::size_t width);

/// What came of a session, for people; ends with a line end.
[[nodiscard]] std::string summaryText(const SyncSummary& summary);

}  // namespace appsync
