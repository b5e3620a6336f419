#pragma once

#include <cstddef>
#include <set>
#include <string>
#include <vector>

#include "tests/reliability/Invariants.h"
#include "tests/reliability/World.h"

namespace appsync {

/// What the plug-in has to get done in sessions in which no call fails, of the applications that
/// nobody else meddles with: a client that does nothing keeps every other promise.
class Demands {
  public:
    Demands(World& world, Invariants& invariants) : world_(world), invariants_(invariants) {}

    /// Others have a hand in what becomes of the application: nothing is demanded of it.
    void leaveOut(const std::string& identifier) { leftOut_.insert(identifier); }
    // What policy says, as long as the device lives.
    void forbidInstalls() { allowsInstalls_ = false; }
    void forbidRemovals() { allowsRemovals_ = false; }

    /// A restore of these is over.
    void restored(const std::vector<std::string>& identifiers);
    /// Its restore or its update may put a placeholder there at any time: a removal may find that,
    /// and take it.
    void mayBePlaced(const std::string& identifier) { mayBePlaced_.insert(identifier); }
    /// The host is about to have the list reconciled that it has staged.
    void willReconcile(const PropertyList& list);
    /// The host is about to ask which packages it is to send.
    void willAsk();
    /// This is the answer.
    void wereAskedFor(const std::vector<SyncAssetPointer>& assets);
    /// The package of an application of the list has come whole, or has not.
    void delivered(const std::string& identifier) { delivered_.insert(identifier); }
    void notDelivered(const std::string& identifier);
    /// Everything has come to its end.
    void sessionHasEnded();

    /// How many things were demanded so far.
    [[nodiscard]] std::size_t count() const { return count_; }

  private:
    [[nodiscard]] bool isDemanding() const { return world_.faults.injected().empty(); }
    /// The identifiers of the entries that ask for an install.
    [[nodiscard]] std::set<std::string> listedToInstall() const;
    [[nodiscard]] bool isFree(const std::string& identifier) const;
    void demand(bool isDone, const std::string& otherwise);

    World& world_;
    Invariants& invariants_;
    bool allowsInstalls_ = true;
    bool allowsRemovals_ = true;
    std::set<std::string> leftOut_;
    std::set<std::string> wanted_;     // the packages that are to be asked for
    std::set<std::string> delivered_;  // by any session
    std::set<std::string> removed_;    // by any session
    std::set<std::string> placed_;     // of the removed ones, those under a placeholder
    std::set<std::string> mayBePlaced_;
    std::size_t count_ = 0;
};

}  // namespace appsync
