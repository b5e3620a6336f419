#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "device/coordination/CoordinationHerald.h"
#include "device/coordination/LiveCoordinator.h"
#include "device/install/InstallContext.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/Result.h"

namespace appsync {

struct BundleRow;
class Database;
class DevicePlaceholder;

/// The coordinators of a device: looks them up, adds their pieces, puts their placeholders on the
/// home screen, and ends them. The database says which coordinators there are; their pieces are
/// what memory says, and the database follows.
///
/// Callable on any thread. Handles on coordinators share it and may outlive the device: once it is
/// closed, it answers from memory and refuses every change.
class CoordinationBook : public std::enable_shared_from_this<CoordinationBook> {
  public:
    using Coordinator = std::shared_ptr<LiveCoordinator>;
    /// What a book is open for: with Look, coordinators can be created and cancelled, no more.
    enum class Access { Session, Look };

    /// What is passed in outlives the book's being open.
    CoordinationBook(const InstallContext& context, CoordinationHerald& herald, Access access);

    /// `install` gets each coordinator whose pieces are all there, once. Called before others know
    /// the book.
    void setInstaller(std::function<void(const Coordinator&)> install);
    void close();

    // Looking up. See InstallCoordinatorService.

    [[nodiscard]] InstallCoordinatorService::Coordinator lookUp(
        CoordinatorKind kind, const std::string& identifier, CoordinationClient client,
        InstallCoordinatorService::Creation creation);
    /// Null when there is none.
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existing(const std::string& identifier);
    [[nodiscard]] Coordinator find(const std::string& identifier);
    /// As `Device::createCoordinator`.
    Status create(const std::string& identifier, CoordinationClient client);

    /// Takes over what earlier sessions left, and has installed what is complete of it. Once.
    void resume();

    // Adding pieces. See InstallCoordinator; a null promise or placeholder is refused.

    Status setOptions(const Coordinator& coordinator, const InstallOptions& options);
    Status setInitialAssets(const Coordinator& coordinator,
                            const std::vector<std::shared_ptr<LivePromise>>& promises);
    Status setPromise(const Coordinator& coordinator, PromiseRole role,
                      const std::shared_ptr<LivePromise>& promise);
    Status setResponsible(const Coordinator& coordinator, CoordinationClient client);
    Status setPlaceholder(const Coordinator& coordinator,
                          const std::shared_ptr<DevicePlaceholder>& placeholder);
    /// Has the observers of a coordinator that restores hear nothing of it until `tellNews`: its
    /// client books the placeholder once it has handed it in, and news that overtook that would be
    /// lost.
    void holdNews(const LiveCoordinator& coordinator);
    void tellNews(const LiveCoordinator& coordinator);

    // Ending.

    void cancel(const Coordinator& coordinator, const ErrorRecord& reason,
                CoordinationClient client);
    /// Its install was committed, and the coordinator went with that.
    void installed(const Coordinator& coordinator);
    /// Its install failed: the placeholder goes, an installed version stays. That of a restore
    /// stands on, with another coordinator that waits for a package again.
    void failed(const Coordinator& coordinator, const ErrorRecord& error);
    /// Tells of what others have cancelled through the database. Cheap when that is nothing.
    void hearOfOthers();

    /// For a thread of the service's that is going to end something: see CoordinationHerald::Help.
    [[nodiscard]] CoordinationHerald::Help helpToTell() {
        return CoordinationHerald::Help(herald_);
    }

    // What the sync client has delivered and is not yet installed, or not yet told of.

    [[nodiscard]] std::vector<std::string> installsUnderWay();
    [[nodiscard]] bool waitForInstalls(std::chrono::milliseconds longest);

    /// The install type that its options give; none without options.
    [[nodiscard]] std::uint64_t installTypeOf(const LiveCoordinator& coordinator) const;

  private:
    [[nodiscard]] Status requireSession() const;
    /// Null when there is none.
    [[nodiscard]] Result<Coordinator> hearAndFind(const std::string& identifier);
    /// What others have ended since it was last heard of.
    Status readNews(Database& database, std::vector<Cancellation>& news) const;
    void hearAll(const std::vector<Cancellation>& news);
    [[nodiscard]] InstallCoordinatorService::Coordinator begin(CoordinatorKind kind,
                                                               const std::string& identifier,
                                                               CoordinationClient client);
    [[nodiscard]] InstallCoordinatorService::Coordinator writeAtOnce(const Coordinator& made);
    [[nodiscard]] Status requireInstalled(const std::string& identifier);
    [[nodiscard]] Result<std::int64_t> takeId();
    [[nodiscard]] Coordinator begun(const std::string& identifier) const;
    [[nodiscard]] Result<Coordinator> keepUnlessKnown(const Coordinator& made);
    [[nodiscard]] Coordinator keep(const Coordinator& made, const Coordinator& over);
    [[nodiscard]] InstallCoordinatorService::Coordinator answer(CoordinatorKind kind,
                                                                const Coordinator& found);
    Coordinator adopt(const StoredCoordinator& stored);
    [[nodiscard]] bool knowsAnother(const StoredCoordinator& stored) const;
    [[nodiscard]] std::shared_ptr<InstallCoordinator> handle(const Coordinator& coordinator);

    [[nodiscard]] LivePromise::Listener listener(const Coordinator& coordinator, PromiseRole role,
                                                 const std::shared_ptr<LivePromise>& promise);
    Status attach(const Coordinator& coordinator, PromiseRole role,
                  const std::shared_ptr<LivePromise>& promise);
    void promiseChanged(const Coordinator& coordinator, PromiseRole role,
                        const LivePromise& promise, LivePromise::Change change);
    void madeProgress(const Coordinator& coordinator, double percent);
    void showProgress(const LiveCoordinator& coordinator, double percent);
    void noteDelivery(const LiveCoordinator& coordinator);

    void saveLater(const Coordinator& coordinator);
    void saveNow(const Coordinator& coordinator);
    void proceed(const Coordinator& coordinator);
    void finishWithoutInstall(const Coordinator& coordinator);

    Status show(const Coordinator& coordinator, const DevicePlaceholder& placeholder);
    Status putOnHomeScreen(const Coordinator& coordinator, const DevicePlaceholder& placeholder);
    [[nodiscard]] Result<std::optional<BundleRow>> standingPlaceholder(
        const std::string& identifier) const;
    Status borrow(const Coordinator& coordinator);
    Status recordShown(const Coordinator& coordinator, PlaceholderState state, Database& database);

    void hear(const Cancellation& cancellation);
    enum class FailureOf { Install, Placeholder };
    void fail(const Coordinator& coordinator, const ErrorRecord& error, FailureOf what);
    /// False when it had ended before.
    [[nodiscard]] bool retire(const Coordinator& coordinator,
                              const std::optional<ErrorRecord>& error);
    void removeFiles(const LiveCoordinator& coordinator);
    void removePackage(const LiveCoordinator& coordinator);
    /// The directory of them, with a slash at its end.
    [[nodiscard]] static std::string placeholderFilesOf(const std::string& identifier);
    void removePlaceholderFiles(const std::string& identifier);
    void removeFile(const std::string& path);
    void tell(const Coordinator& coordinator, CoordinationHerald::Call call);
    void tellLast(const Coordinator& coordinator, CoordinationHerald::Call call);
    void tellPlaceholder(const Coordinator& coordinator);
    void tellCompletion(const Coordinator& coordinator);
    void tellCancellation(const Coordinator& coordinator, const ErrorRecord& reason,
                          CoordinationClient client);

    const InstallContext context_;
    CoordinationHerald& herald_;
    const Access access_;
    std::function<void(const Coordinator&)> install_;
    std::atomic<bool> closed_ = false;
    std::atomic<std::int64_t> heardOf_ = 0;  // the last cancellation
    std::once_flag resumed_;

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::unordered_map<std::string, Coordinator> coordinators_;
    std::int64_t nextId_ = 0;  // of those that were reserved
    std::int64_t lastId_ = -1;
    std::map<std::string, std::int64_t> underWay_;  // identifiers, and which coordinator of theirs
    std::condition_variable underWayShrank_;
};

}  // namespace appsync
