#pragma once

#include <string_view>

namespace appsync {

/// What it takes to undo a change that a service of the device has made. Its records are those of
/// one log: what is lost of them is always the end of it.
enum class Persistence {
    /// It goes with whatever is committed next; the end of the process may take it.
    Soon,
    /// The end of the process leaves it; a loss of power may take it.
    Committed,
    /// Nothing takes it, nor what was before it.
    OnDisk,
};

/// Hears of everything that a simulated service changes on the device, when it has: files, and the
/// records of the registry, the coordination service and the others. Nothing waits meanwhile, and
/// nothing may be called across platform/.
class DurableChangeListener {
  public:
    virtual ~DurableChangeListener() = default;
    virtual void filesChanged(std::string_view what) = 0;
    virtual void recordsChanged(std::string_view what, Persistence persistence) = 0;
};

}  // namespace appsync
