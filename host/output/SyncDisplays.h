#pragma once

// host/output: what commands say, as text or as JSON. SyncDisplays.h shows a session while it runs,
// as lines or JSON, and its summary, TerminalDisplay.h (with SessionProgress.h) as bars; PlanText.h
// and JsonSync.h show plans, JsonSync.h events and summaries too; JsonRecords.h has the JSON of
// what a device holds; DeviceOverview.h shows it at a glance; WhyAnswer.h answers what an
// application waits for; PropertyListOutline.h shows a property list. All of them make text of
// values that others have gathered: nothing here asks a device or decides anything. Contracts with
// programs that read it: docs/commands.md. Includes session, watch, plan, console, and of the
// device its values and packages; called by the commands.

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "host/watch/SyncEvents.h"

namespace appsync {

struct Console;

enum class SyncDisplayKind { Text, Json, JsonLines };

/// The display that suits: for people bars on a terminal, else a line per event; for programs one
/// object at the end, or one per event. Lists are cut on a terminal, unless it is `isVerbose`. The
/// console must outlive it.
[[nodiscard]] std::unique_ptr<SyncDisplay> makeSyncDisplay(SyncDisplayKind kind,
                                                           const Console& console,
                                                           bool isVerbose = false);

/// One line about an event, without line end: "transfer com.example.atlas: 50 % (1.0 MiB of 2.0
/// MiB)".
[[nodiscard]] std::string eventLine(const SyncEvent& event);

/// The bar of an event, at most `width` characters.
[[nodiscard]] std::string eventBar(const SyncEvent& event, std::size_t width,
                                   std::string_view cutMark = "...");

/// A bar that shows so much, in a line of that width: "[####................]  20 %".
[[nodiscard]] std::string percentBar(unsigned percent, std::size_t width);

/// What came of a session, for people; ends with a line end. How many failed, but not why: errors
/// go to the error stream. On a terminal long lists are cut, and like reasons told once, unless it
/// is to be verbose.
[[nodiscard]] std::string summaryText(const SyncSummary& summary, bool isForTerminal = false,
                                      bool isVerbose = false);

/// Tells of what has failed: one line for each reason, with those that it befell; of many a
/// terminal gets the number and the first few, unless it is to be verbose.
void complainOfFailures(const SyncSummary& summary, const Console& console, bool isVerbose);

}  // namespace appsync
