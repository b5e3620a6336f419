#include "tests/reliability/Invariants.h"

#include <algorithm>
#include <chrono>
#include <map>
#include <sstream>
#include <utility>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "simulation/recording/KnownCalls.h"
#include "tests/client/AppsClientTestAccess.h"

namespace appsync {
namespace {

using Access = AppsClientTestAccess;

const std::string kStagedList = std::string(kStagingArea) + "/ApplicationsSync.plist";
constexpr std::string_view kChanging = "Changing ";
constexpr const char* kAtomicWrite = "FileSystem.writeFileAtomically";
constexpr const char* kUninstall = "AppRegistry.uninstallApplication";
constexpr std::string_view kWaitBegins = "Will wait for ";
constexpr std::string_view kWaitEnds = "Finished waiting for placeholder installs";
constexpr std::chrono::seconds kWaitForEachPlaceholder{5};

std::string textAt(const PropertyList& entry, std::string_view key) {
    const std::string* text = entry.findString(key);
    return text != nullptr ? *text : "(none)";
}

/// How far an entry has come.
int rankOf(const std::string& operation) {
    if (operation == kTodoSent || operation == kTodoDownloaded) return 1;
    if (operation == kTodoInstalled || operation == kTodoFailed) return 2;
    return 0;
}

bool namesTheSame(const PropertyList& one, const PropertyList& other) {
    return std::equal(one.elements().begin(), one.elements().end(), other.elements().begin(),
                      other.elements().end(), [](const auto& a, const auto& b) {
                          return textAt(a, kTodoIdentifierKey) == textAt(b, kTodoIdentifierKey);
                      });
}

bool isCallTo(const RecordEntry& entry, std::string_view service, std::string_view method) {
    return entry.method == method && withoutNumber(entry.service) == service;
}

std::set<std::string> packagesIn(const World& world) {
    std::set<std::string> packages;
    for (const std::string& name : world.platform.files.names(std::string(kPublicStaging))) {
        if (name.ends_with(".zip")) packages.insert(name);
    }
    return packages;
}

}  // namespace

Invariants::Invariants(World& world)
    : world_(world),
      packagesBefore_(packagesIn(world)),
      faultsBefore_(world.faults.injected().size()) {
    for (const std::string& each : world_.platform.registry.installedIdentifiers()) {
        installed_.insert(each);
    }
    world_.platform.onCall(kAtomicWrite, [this](const RecordEntry&) { look(); });
    world_.platform.onCall(kUninstall, [this](const RecordEntry& call) { lookAtUninstall(call); });
}

Invariants::~Invariants() {
    world_.platform.onCall(kAtomicWrite, {});
    world_.platform.onCall(kUninstall, {});
}

void Invariants::sessionBegins(const PropertyList& todoList) {
    look();
    staged_ = todoList;
    earlier_.clear();
    for (const PropertyList& entry : todoList.elements()) {
        const std::string identifier = textAt(entry, kTodoIdentifierKey);
        const SimulatedCoordination& service = world_.platform.coordination;
        if (service.state(identifier) == nullptr && service.ended(identifier) == nullptr) continue;
        earlier_.insert(identifier);
    }
    for (const std::string& identifier : identifiersToRemove(todoList)) mayRemove(identifier);
}

void Invariants::sessionBeginsWithoutList() {
    look();
    listMayGo_ = true;
}

void Invariants::look() {
    noticeTakeover();
    lookAtTodoList();
}

/// Until the staging area is taken over, installs of the session before go on marking its list.
void Invariants::noticeTakeover() {
    if (!staged_ || world_.platform.files.exists(kStagedList)) return;
    todoList_ = *std::exchange(staged_, std::nullopt);
    listMayGo_ = false;
}

void Invariants::lookAtTodoList() {
    const auto now = world_.platform.propertyListAt(std::string(kTodoListPath));
    if (todoList_.isNull()) return;
    if (!now) {
        if (!mayLackTodoList()) violate("the todo list was missing in between");
        return;
    }
    compareTodoLists(todoList_, *now);
    todoList_ = *now;
}

/// While the next list lies where the host has left it, or where there is none.
bool Invariants::mayLackTodoList() const { return staged_.has_value() || listMayGo_; }

void Invariants::compareTodoLists(const PropertyList& before, const PropertyList& after) {
    if (!namesTheSame(before, after)) {
        violate("the todo list has lost or gained an entry");
        return;
    }
    for (std::size_t i = 0; i < before.size(); ++i) {
        const std::string was = textAt(*before.at(i), kTodoOperationKey);
        const std::string is = textAt(*after.at(i), kTodoOperationKey);
        const std::string identifier = textAt(*before.at(i), kTodoIdentifierKey);
        if (is != was && is == kTodoInstalled) noteInstalled(identifier);
        if (maySucceed(identifier, was, is)) continue;
        violate("the todo entry of " + identifier + " went from " + was + " to " + is);
    }
}

bool Invariants::maySucceed(const std::string& identifier, const std::string& was,
                            const std::string& is) const {
    if (is == was || rankOf(is) > rankOf(was)) return true;
    if (!world_.coordinated) return false;
    // A restore that comes from elsewhere meanwhile marks its end, too, whatever the session's own
    // install has come to, or comes to.
    if (rankOf(is) == 2) return earlier_.contains(identifier) || restored_.contains(identifier);
    // The end of a transfer is marked whatever its install has come to meanwhile: a coordinator can
    // end before the transfer does. The mark says what the host has done, and nobody is left who
    // would install it.
    return rankOf(is) == 1 && world_.platform.coordination.ended(identifier) != nullptr;
}

void Invariants::noteInstalled(const std::string& identifier) {
    const auto* ended = world_.platform.coordination.ended(identifier);
    if (ended != nullptr && ended->kind == CoordinatorKind::RestoringDemoted) {
        markedByRestore_.insert(identifier);
        restored_.insert(identifier);
    } else {
        markedByRestore_.erase(identifier);
    }
}

void Invariants::sessionHasEnded() {
    look();
    checkFilesParse();
    checkTodoListIsKept();
    checkApplicationsAreKept();
    checkMarksAreTrue();
    checkMarksAreMade();
    checkAccounts();
    checkRetries();
    checkWaitGroups();
    checkRestoreWaits();
    checkAwaitedPlaceholders();
    checkRestoreInfoIsKept();
    checkPackages();
    checkHandles();
}

void Invariants::checkFilesParse() {
    for (const std::string& path : world_.platform.files.paths("/var/mobile")) {
        if (!path.ends_with(".plist") || world_.platform.propertyListAt(path)) continue;
        violate(path + " is no property list");
    }
}

/// The list is where it was taken to, or where the host left it.
void Invariants::checkTodoListIsKept() {
    if (listMayGo_ || (todoList_.isNull() && !staged_)) return;
    if (world_.platform.files.exists(std::string(kTodoListPath))) return;
    if (world_.platform.files.exists(kStagedList)) return;
    violate("the todo list is gone");
}

void Invariants::checkApplicationsAreKept() {
    for (const std::string& identifier : installed_) {
        if (world_.platform.registry.installed(identifier) || removable_.contains(identifier)) {
            continue;
        }
        if (!undone_.contains(identifier)) violate(identifier + " was installed and is gone");
    }
}

/// An install that has failed for good is undone by an uninstall without options. It takes the
/// placeholder; where the registry has never taken one it takes what is there.
void Invariants::lookAtUninstall(const RecordEntry& call) {
    const std::string identifier = call.arguments.substr(0, call.arguments.find(','));
    if (world_.platform.registry.placeholder(identifier)) return;
    if (countBeginning(identifier + " install failed unrecoverably") == 0) return;
    if (!wasPlaceholderTaken(identifier)) undone_.insert(identifier);
}

/// Since the host has last asked for what it is to send.
bool Invariants::wasPlaceholderTaken(const std::string& identifier) const {
    const std::string named = "BundleIdentifier = " + identifier + ";";
    bool wasTaken = false;
    for (const RecordEntry& entry : world_.platform.recording()) {
        if (entry.text.starts_with("outstandingAssetTransfers starting")) wasTaken = false;
        if (!isCallTo(entry, "AppRegistry", "installPlaceholderBundle")) continue;
        if (entry.arguments.find(named) != std::string::npos) wasTaken = entry.result == "ok";
    }
    return wasTaken;
}

void Invariants::checkMarksAreTrue() {
    for (const PropertyList& entry : todoList_.elements()) {
        const std::string identifier = textAt(entry, kTodoIdentifierKey);
        if (textAt(entry, kTodoOperationKey) != kTodoInstalled) continue;
        if (world_.platform.registry.installed(identifier)) continue;
        if (removable_.contains(identifier) || markedByRestore_.contains(identifier)) continue;
        violate(identifier + " is marked as installed and is not");
    }
}

/// Where no call has failed, the list says what the log says.
void Invariants::checkMarksAreMade() {
    if (hasFailed("") || listMayGo_) return;
    std::map<std::string, std::string> marks;  // those of the list that was taken over last
    for (const RecordEntry& entry : world_.platform.recording()) {
        if (entry.method == "moveItem" && entry.arguments.starts_with(kStagingArea)) marks.clear();
        const std::size_t from = entry.text.find(" from ");
        if (!entry.text.starts_with(kChanging) || from == std::string::npos) continue;
        marks[entry.text.substr(kChanging.size(), from - kChanging.size())] =
            entry.text.substr(entry.text.rfind(' ') + 1);
    }
    for (const auto& [identifier, mark] : marks) {
        const auto index = indexOfEntry(todoList_, identifier);
        if (index && textAt(*todoList_.at(*index), kTodoOperationKey) == mark) continue;
        violate(identifier + " is not marked as " + mark);
    }
}

/// Nothing that was begun is forgotten.
void Invariants::checkAccounts() {
    const std::size_t queued = countCalls("OperationQueue", "add");
    if (queued != countBeginning("Performing install for ") ||
        queued != countBeginning("Finished install for ")) {
        violate("an install that was queued did not run to its end");
    }
    std::size_t answered = 0;
    for (const std::string& text : world_.platform.messages()) {
        if (text.starts_with("Uninstall of ") &&
            text.find(" with install coordinator ") != std::string::npos) {
            ++answered;
        }
    }
    if (answered != countCalls("InstallCoordinatorService", "uninstallApp")) {
        violate("an uninstall was asked for and its outcome was not heard of");
    }
    for (const std::string& blocked : world_.platform.scheduler.blockedTasks()) violate(blocked);
    if (world_.platform.scheduler.delayedTasks() != 0) violate("something is still to come");
}

void Invariants::checkRetries() {
    if (world_.client != nullptr && retriesThatDidNotCome() != 0) {
        violate("a retry that was announced did not come");
    }
}

std::int64_t Invariants::retriesThatDidNotCome() const {
    return static_cast<std::int64_t>(countBeginning("Will retry installation of ")) -
           static_cast<std::int64_t>(countBeginning("Re-enqueue installation request for "));
}

/// The install group is empty, but for the retries that a client has taken with it; the one that
/// restores wait for, its count and its set say the same.
void Invariants::checkWaitGroups() {
    std::map<std::string, std::int64_t> entered;
    std::string ofRestores;
    for (const RecordEntry& entry : world_.platform.recording()) {
        if (withoutNumber(entry.service) != "WaitGroup") continue;
        if (entry.method == "enter") ++entered[entry.service];
        if (entry.method == "leave") --entered[entry.service];
        if (entry.method == "waitFor") ofRestores = entry.service;
    }
    const auto found = entered.extract(ofRestores);
    const std::int64_t awaited = found.empty() ? 0 : found.mapped();
    std::int64_t taken = world_.client == nullptr ? retriesThatDidNotCome() : 0;
    for (const auto& [group, count] : entered) {
        if (count == std::exchange(taken, 0)) continue;
        violate(group + " was not left as often as it was entered");
    }
    if (world_.client == nullptr) return;
    const auto& set = Access::placeholdersForRestoringApps(*world_.client);
    if (Access::restoringPlaceholderCount(*world_.client) != awaited ||
        static_cast<std::int64_t>(set.size()) != awaited) {
        violate("restoring placeholders, their count and their group do not say the same");
    }
}

/// A restore waits once, for as long as it has said, whatever comes meanwhile.
void Invariants::checkRestoreWaits() {
    const auto& recording = world_.platform.recording();
    for (std::size_t i = 0; i < recording.size(); ++i) {
        if (recording[i].text.starts_with(kWaitBegins)) checkRestoreWait(i);
    }
}

/// How many placeholders were awaited when the recording was so long.
std::int64_t Invariants::countAwaited(std::size_t before) const {
    const auto& recording = world_.platform.recording();
    std::int64_t awaited = 0;
    for (std::size_t i = 0; i < before; ++i) {
        const std::string& text = recording[i].text;
        if (text.starts_with("Relocant will wait for TS to install placeholder")) ++awaited;
        if (text.starts_with("Relocant cancelled coordinator for restoring app")) --awaited;
        if (text.starts_with("TS finished installing placeholder")) --awaited;
    }
    return awaited;
}

void Invariants::checkRestoreWait(std::size_t announced) {
    const auto& recording = world_.platform.recording();
    const RecordEntry& begin = recording[announced];
    std::istringstream words(begin.text.substr(kWaitBegins.size()));
    std::string word;
    std::int64_t seconds = -1;
    std::int64_t placeholders = -1;
    words >> seconds >> word >> word >> placeholders;
    const std::chrono::seconds said = placeholders * kWaitForEachPlaceholder;
    // In between others may have a turn.
    const bool isCounted = world_.isInterleaved || placeholders == countAwaited(announced);
    if (said.count() != seconds || !isCounted) violate("a wait of another length: " + begin.text);
    std::vector<std::string> waits;
    const auto end = std::find_if(recording.begin() + static_cast<std::ptrdiff_t>(announced),
                                  recording.end(), [&](const RecordEntry& entry) {
                                      if (entry.task != begin.task) return false;
                                      if (isCallTo(entry, "WaitGroup", "waitFor")) {
                                          waits.push_back(entry.arguments);
                                      }
                                      return entry.text == kWaitEnds;
                                  });
    const auto milliseconds = std::chrono::milliseconds(said).count();
    if (waits != std::vector<std::string>{std::to_string(milliseconds) + " ms"}) {
        violate("another wait than was announced: " + begin.text);
    }
    if (end == recording.end()) {
        violate("a wait that did not end: " + begin.text);
    } else if (!world_.isInterleaved && end->time - begin.time > said) {
        violate("a wait that took longer: " + begin.text);
    }
}

/// What the plug-in has given up itself it does not wait for.
void Invariants::checkAwaitedPlaceholders() {
    if (world_.client == nullptr) return;
    for (const std::string& identifier : Access::placeholdersForRestoringApps(*world_.client)) {
        const auto* ended = world_.platform.coordination.ended(identifier);
        if (ended == nullptr || !ended->cancelled || ended->cancelled->client != SyncClientID) {
            continue;
        }
        // Another restore of it has come after that.
        if (world_.platform.coordination.state(identifier) != nullptr) continue;
        // What somebody else cancels stays awaited; an install may have come after that.
        if (ended->kind != CoordinatorKind::Restoring &&
            ended->kind != CoordinatorKind::RestoringDemoted) {
            continue;
        }
        violate(identifier + " is awaited although its restore was given up");
    }
}

void Invariants::checkRestoreInfoIsKept() {
    if (!restoring_) return;
    const auto& files = world_.platform.files;
    if (files.exists(std::string(kRestoreInfoPath))) return;
    if (files.exists(std::string(kProcessedRestoreInfoPath))) return;
    violate("the restore information is gone");
}

void Invariants::checkPackages() {
    for (const std::string& name : packagesIn(world_)) {
        if (!mayLeavePackage(name)) violate("the package " + name + " was left behind");
    }
}

bool Invariants::mayLeavePackage(const std::string& name) const {
    const std::string path = std::string(kPublicStaging) + "/" + name;
    if (hasFailed("FileSystem.removeItem(" + path)) return true;
    // What an earlier run has left, and nobody has sent again.
    if (packagesBefore_.contains(name) &&
        world_.platform.countMessages("Received file at " + path) == 0) {
        return true;
    }
    // A restore's package waits for the application's data.
    const auto state = world_.platform.propertyListAt(std::string(kRestoreStatePath));
    const std::string identifier = name.substr(0, name.rfind('.'));
    if (wasLeftWithRetry(identifier)) return true;
    if (state && state->find(identifier) != nullptr) return true;
    if (world_.platform.countMessages("Restore data exists for " + identifier) != 0) return true;
    // The service removes what it took. What nobody took stays: a coordinator that has ended, or
    // that another client has, takes nothing.
    if (!world_.coordinated) return false;
    if (!wasPromiseKept(identifier, path)) return true;
    const auto* ended = world_.platform.coordination.ended(identifier);
    return ended == nullptr || ended->appAsset == nullptr || !ended->appAsset->complete ||
           !ended->appAsset->path || ended->appAsset->path->path() != path;
}

/// Whether the client went while the install waited for its next try.
bool Invariants::wasLeftWithRetry(const std::string& identifier) const {
    return world_.client == nullptr &&
           countBeginning("Will retry installation of " + identifier + " ") !=
               world_.platform.countMessages("Re-enqueue installation request for " + identifier);
}

/// Whether a call that begins so has failed since this looks on.
bool Invariants::hasFailed(std::string_view beginning) const {
    const auto& faults = world_.faults.injected();
    return std::any_of(
        faults.begin() + static_cast<std::ptrdiff_t>(faultsBefore_), faults.end(),
        [beginning](const std::string& fault) { return fault.starts_with(beginning); });
}

/// Whether the service was given what came last.
bool Invariants::wasPromiseKept(const std::string& identifier, const std::string& path) const {
    bool kept = false;
    for (const RecordEntry& entry : world_.platform.recording()) {
        if (entry.text == "Received file at " + path) kept = false;
        if (entry.method == "setComplete" && entry.arguments == identifier + "-Asset") kept = true;
    }
    return kept;
}

void Invariants::checkHandles() {
    if (!world_.platform.homeScreen.heldAssertions().empty()) violate("an assertion is held");
    if (world_.platform.icons.liveObjects() != 0) violate("a rendering's object is left");
}

void Invariants::clientGoes() {
    const std::weak_ptr<AppsClient> gone = world_.client;
    world_.client.reset();
    world_.settle();
    if (!gone.expired()) violate("somebody still holds the client");
    if (world_.platform.registry.observers() != 0) violate("the registry is still observed");
    if (!world_.platform.coordination.appInstallObservers().empty()) {
        violate("the coordination service is still observed");
    }
    if (world_.platform.notificationCenter.observers(kStartUp) != 0) {
        violate("a notification is still observed");
    }
    checkHandles();
    const std::size_t calls = world_.platform.recording().size();
    world_.settle();
    if (world_.platform.recording().size() != calls) {
        violate("called after its end: " + world_.platform.recording().at(calls).line());
    }
}

std::size_t Invariants::countBeginning(std::string_view text) const {
    const auto& recording = world_.platform.recording();
    return static_cast<std::size_t>(
        std::count_if(recording.begin(), recording.end(), [text](const RecordEntry& entry) {
            return entry.kind == RecordEntry::Kind::Message && entry.text.starts_with(text);
        }));
}

std::size_t Invariants::countCalls(std::string_view service, std::string_view method) const {
    const auto& recording = world_.platform.recording();
    return static_cast<std::size_t>(
        std::count_if(recording.begin(), recording.end(),
                      [&](const RecordEntry& entry) { return isCallTo(entry, service, method); }));
}

}  // namespace appsync
