#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/PropertyList.h"
#include "tests/reliability/World.h"

namespace appsync {

/// What holds whatever fails, in whatever order things happen. Looks on from the moment it is made;
/// says what was broken, a line each.
class Invariants {
  public:
    /// Everything that is installed now stays, unless somebody asks for its removal.
    explicit Invariants(World& world);
    ~Invariants();

    Invariants(const Invariants&) = delete;
    Invariants& operator=(const Invariants&) = delete;

    /// The host has staged this list and begins a session with it.
    void sessionBegins(const PropertyList& todoList);
    /// The host begins a session without a list: that of the last one may go.
    void sessionBeginsWithoutList();
    /// The application is installed, from now on.
    void mustKeep(const std::string& identifier) { installed_.insert(identifier); }
    /// Somebody wants the application removed.
    void mayRemove(const std::string& identifier) { removable_.insert(identifier); }
    /// A restore began; its information is never lost.
    void restoreBegins() { restoring_ = true; }
    void violate(const std::string& what) { violations_.push_back(what); }

    /// Everything has come to its end. Where the client has gone before that, retries went with it.
    void sessionHasEnded();
    /// Lets the client go, and looks what it has left.
    void clientGoes();
    /// Looks again at what must stand at every instant.
    void look();

    [[nodiscard]] const std::vector<std::string>& violations() const { return violations_; }

  private:
    void noticeTakeover();
    void lookAtTodoList();
    [[nodiscard]] bool mayLackTodoList() const;
    void compareTodoLists(const PropertyList& before, const PropertyList& after);
    [[nodiscard]] bool maySucceed(const std::string& identifier, const std::string& was,
                                  const std::string& is) const;
    void noteInstalled(const std::string& identifier);
    void lookAtUninstall(const RecordEntry& call);
    [[nodiscard]] bool wasPlaceholderTaken(const std::string& identifier) const;
    void checkFilesParse();
    void checkTodoListIsKept();
    void checkApplicationsAreKept();
    void checkMarksAreTrue();
    void checkMarksAreMade();
    void checkAccounts();
    void checkRetries();
    void checkWaitGroups();
    void checkRestoreWaits();
    void checkRestoreWait(std::size_t announced);
    [[nodiscard]] std::int64_t countAwaited(std::size_t before) const;
    void checkAwaitedPlaceholders();
    void checkRestoreInfoIsKept();
    void checkPackages();
    void checkHandles();
    [[nodiscard]] bool mayLeavePackage(const std::string& name) const;
    [[nodiscard]] bool wasLeftWithRetry(const std::string& identifier) const;
    [[nodiscard]] bool hasFailed(std::string_view beginning) const;
    [[nodiscard]] bool wasPromiseKept(const std::string& identifier, const std::string& path) const;
    [[nodiscard]] std::size_t countBeginning(std::string_view text) const;
    [[nodiscard]] std::int64_t retriesThatDidNotCome() const;
    [[nodiscard]] std::size_t countCalls(std::string_view service, std::string_view method) const;

    World& world_;
    std::set<std::string> installed_;
    std::set<std::string> removable_;
    /// Those that had a coordinator before the list was staged: what that one comes to is marked in
    /// whichever list stands then.
    std::set<std::string> earlier_;
    /// Marked as installed because the restore of an offloaded application is done.
    std::set<std::string> markedByRestore_;
    std::set<std::string> restored_;  // whose entry a restore has marked, whatever came later
    /// What went with a direct install that has failed for good, although it was installed: no
    /// placeholder stood above it.
    std::set<std::string> undone_;
    const std::set<std::string> packagesBefore_;
    /// How many calls had failed before.
    const std::size_t faultsBefore_;
    std::optional<PropertyList> staged_;  // while it is in the staging area
    PropertyList todoList_;               // as it was last seen, or as it was staged; null before
    bool listMayGo_ = false;
    bool restoring_ = false;
    std::vector<std::string> violations_;
};

}  // namespace appsync
