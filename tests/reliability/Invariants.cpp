#include "tests/reliability/Invariants.h"

#include <algorithm>
#include <chrono>
#include <map>
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

}  // namespace

Invariants::Invariants(World& world) : world_(world) {
    for (const std::string& each : world_.platform.registry.installedIdentifiers()) {
        installed_.insert(each);
    }
    world_.platform.onCall(kAtomicWrite, [this](const RecordEntry&) { look(); });
}

Invariants::~Invariants() { world_.platform.onCall(kAtomicWrite, {}); }

void Invariants::sessionBegins(const PropertyList& todoList) {
    look();
    staged_ = todoList;
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
    if (!now || todoList_.isNull()) return;
    compareTodoLists(todoList_, *now);
    todoList_ = *now;
}

void Invariants::compareTodoLists(const PropertyList& before, const PropertyList& after) {
    if (!namesTheSame(before, after)) {
        violate("the todo list has lost or gained an entry");
        return;
    }
    for (std::size_t i = 0; i < before.size(); ++i) {
        const std::string was = textAt(*before.at(i), kTodoOperationKey);
        const std::string is = textAt(*after.at(i), kTodoOperationKey);
        if (rankOf(is) >= rankOf(was)) continue;
        // The end of a transfer is marked whatever its install has come to meanwhile: a coordinator
        // can end before the transfer does. The mark says what the host has done, and nobody is
        // left who would install it.
        if (world_.coordinated && rankOf(is) == 1) continue;
        violate("the todo entry of " + textAt(*before.at(i), kTodoIdentifierKey) +
                " went back from " + was + " to " + is);
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
    checkWaitGroups();
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
        // An install that has failed for good is undone by an uninstall without options. It takes
        // the placeholder; where the registry has refused that it takes what is there.
        const bool undone = !world_.coordinated &&
                            world_.platform.countMessages("Performing install for " + identifier) &&
                            countBeginning(identifier + " install failed unrecoverably") != 0;
        if (!undone) violate(identifier + " was installed and is gone");
    }
}

void Invariants::checkMarksAreTrue() {
    for (const PropertyList& entry : todoList_.elements()) {
        const std::string identifier = textAt(entry, kTodoIdentifierKey);
        if (textAt(entry, kTodoOperationKey) != kTodoInstalled) continue;
        if (world_.platform.registry.installed(identifier)) continue;
        if (removable_.contains(identifier)) continue;
        violate(identifier + " is marked as installed and is not");
    }
}

/// Where no call has failed, the list says what the log says.
void Invariants::checkMarksAreMade() {
    if (!world_.faults.injected().empty() || listMayGo_) return;
    std::map<std::string, std::string> marks;  // those of the list that was taken over last
    for (const RecordEntry& entry : world_.platform.recording()) {
        if (entry.method == "moveItem" && entry.arguments.starts_with(kStagingArea)) marks.clear();
        const std::size_t from = entry.text.find(" from ");
        if (!entry.text.starts_with(kChanging) || from == std::string::npos) continue;
        marks[entry.text.substr(kChanging.size(), from - kChanging.size())] =
            entry.text.substr(entry.text.rfind(' ') + 1);
    }
    for (const auto& [identifier, mark] : marks) {
        const auto index = TodoIndex(todoList_).indexOf(identifier);
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
    if (countBeginning("Will retry installation of ") !=
        countBeginning("Re-enqueue installation request for ")) {
        violate("a retry that was announced did not come");
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

/// The install group is empty; the other one, its count and its set say the same.
void Invariants::checkWaitGroups() {
    std::map<std::string, std::int64_t> entered;
    for (const RecordEntry& entry : world_.platform.recording()) {
        if (withoutNumber(entry.service) != "WaitGroup") continue;
        if (entry.method == "enter") ++entered[entry.service];
        if (entry.method == "leave") --entered[entry.service];
    }
    std::int64_t sum = 0;
    for (const auto& [group, count] : entered) sum += count;
    const auto awaited =
        static_cast<std::int64_t>(Access::placeholdersForRestoringApps(*world_.client).size());
    if (Access::restoringPlaceholderCount(*world_.client) != awaited) {
        violate("the count of restoring placeholders is not that of the set");
    }
    if (sum != awaited) violate("a wait group was not left as often as it was entered");
}

/// What the plug-in has given up itself it does not wait for.
void Invariants::checkAwaitedPlaceholders() {
    for (const std::string& identifier : Access::placeholdersForRestoringApps(*world_.client)) {
        const auto* ended = world_.platform.coordination.ended(identifier);
        if (ended == nullptr || !ended->cancelled || ended->cancelled->client != SyncClientID) {
            continue;
        }
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
    for (const std::string& name : world_.platform.files.names(std::string(kPublicStaging))) {
        if (!name.ends_with(".zip") || mayLeavePackage(name)) continue;
        violate("the package " + name + " was left behind");
    }
}

bool Invariants::mayLeavePackage(const std::string& name) const {
    const std::string path = std::string(kPublicStaging) + "/" + name;
    if (world_.faults.hasInjected("FileSystem.removeItem(" + path)) return true;
    // A restore's package waits for the application's data.
    const auto state = world_.platform.propertyListAt(std::string(kRestoreStatePath));
    const std::string identifier = name.substr(0, name.rfind('.'));
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
        std::count_if(recording.begin(), recording.end(), [&](const RecordEntry& entry) {
            return entry.method == method && withoutNumber(entry.service) == service;
        }));
}

}  // namespace appsync
