#pragma once

#include <optional>
#include <span>
#include <string>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// One icon of the home screen.
struct HomeScreenItem {
    std::string identifier;
    /// What stands below the icon, cut to fit; the identifier when it is empty.
    std::string name;
    /// The icon as a PNG; empty for none. One that cannot be read counts as none. Without an icon
    /// one is drawn: the name's first letter on a colour that follows from the identifier.
    Bytes icon;
    /// Dimmed, as the application cannot be used yet.
    bool isPlaceholder = false;
    /// How far its transfer or install has come, from 0 to 1; drawn when there is one.
    std::optional<double> progress = std::nullopt;
};

/// Draws the home screen as a PNG: the items in order, four in a row, the picture growing downward
/// as far as they need. Callable on any thread. `title` stands in the status bar. Fails when the
/// picture would be too large or memory runs out.
[[nodiscard]] Result<Bytes> drawHomeScreen(std::span<const HomeScreenItem> items,
                                           const std::string& title);

}  // namespace appsync
