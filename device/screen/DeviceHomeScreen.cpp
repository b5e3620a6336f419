#include "device/screen/DeviceHomeScreen.h"

#include <unordered_set>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/database/RegistryTables.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageIdentifier.h"
#include "device/values/WallClock.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

namespace {

/// What the home screen answers when its own database fails.
constexpr int kCannotTell = 3;

class Connection final : public HomeScreenConnection {
  public:
    Connection(DeviceHomeScreen& screen, PropertyListSerialization& propertyLists)
        : screen_(screen), propertyLists_(propertyLists) {}

    bool setIconState(ByteView state) override { return screen_.setOrder(state).ok(); }

    std::optional<Bytes> flattenedIconState(std::uint64_t /*variant*/) override {
        const Result<std::vector<std::string>> order = screen_.order();
        if (!order) return std::nullopt;
        Result<Bytes> bytes =
            propertyLists_.serialize(PropertyList::strings(*order), PropertyListFormat::Binary);
        if (!bytes) return std::nullopt;
        return std::move(*bytes);
    }

  private:
    DeviceHomeScreen& screen_;
    PropertyListSerialization& propertyLists_;
};

class Assertion final : public TerminationAssertion {
  public:
    Assertion(DeviceDatabase& database, std::string identifier)
        : database_(database), identifier_(std::move(identifier)) {}
    Assertion(const Assertion&) = delete;
    Assertion& operator=(const Assertion&) = delete;
    ~Assertion() override {
        database_.change(Durability::Soon, [this](Database& database) { return release(database); })
            .ignore();
    }

  private:
    Status release(Database& database) const {
        Status status = database
                            .query(
                                "UPDATE assertions SET count = count - 1"
                                " WHERE identifier = ?")
                            .bind(identifier_)
                            .run();
        if (!status) return status;
        return database.query("DELETE FROM assertions WHERE identifier = ? AND count < 1")
            .bind(identifier_)
            .run();
    }

    DeviceDatabase& database_;
    const std::string identifier_;
};

Result<bool> holds(Database& database, const char* sql, const std::string& identifier) {
    Query rows = database.query(sql);
    rows.bind(identifier);
    const bool found = rows.next();
    if (Status status = rows.status(); !status) return status.error();
    return found;
}

Status recordDenial(Database& database, const std::string& identifier,
                    std::chrono::seconds retryInterval) {
    const WallTime now = wallNow();
    return database
        .query("INSERT OR REPLACE INTO denials (identifier, time, next_try) VALUES (?, ?, ?)")
        .bind(identifier, milliseconds(now), milliseconds(now + retryInterval))
        .run();
}

Status recordAssertion(Database& database, const std::string& identifier) {
    Status status = database
                        .query(
                            "INSERT INTO assertions (identifier, count) VALUES (?, 1)"
                            " ON CONFLICT (identifier) DO UPDATE SET count = count + 1")
                        .bind(identifier)
                        .run();
    if (!status) return status;
    return database.query("DELETE FROM denials WHERE identifier = ?").bind(identifier).run();
}

Status askToEnd(Database& database, const std::string& identifier,
                std::chrono::seconds retryInterval, int& outcome) {
    using Outcome = TerminationAssertionResult::Outcome;
    const Result<bool> installed = isInstalled(database, identifier);
    if (!installed) return installed.error();
    outcome = Outcome::kNoSuchApplication;
    if (!*installed) return {};
    const Result<bool> running =
        holds(database, "SELECT 1 FROM running WHERE identifier = ?", identifier);
    if (!running) return running.error();
    outcome = *running ? Outcome::kDenied : Outcome::kGranted;
    return *running ? recordDenial(database, identifier, retryInterval)
                    : recordAssertion(database, identifier);
}

Result<Bytes> storedState(Database& database) {
    Query rows = database.query("SELECT state FROM icon_layout");
    Bytes state;
    if (rows.next()) state = rows.blob(0);
    if (Status status = rows.status(); !status) return status.error();
    return state;
}

Status stateRefused(std::string_view what) {
    return ErrorRecord::make(kPropertyListErrorDomain, 0,
                             "the icon layout is refused: " + std::string(what));
}

/// Identifiers in order, each once.
class IdentifierList {
  public:
    void add(const std::string& identifier) {
        if (seen_.insert(identifier).second) order_.push_back(identifier);
    }
    [[nodiscard]] std::vector<std::string> take() { return std::move(order_); }

  private:
    std::vector<std::string> order_;
    std::unordered_set<std::string> seen_;
};

}  // namespace

DeviceHomeScreen::DeviceHomeScreen(DeviceDatabase& database,
                                   PropertyListSerialization& propertyLists,
                                   std::chrono::seconds retryInterval)
    : database_(database), propertyLists_(propertyLists), retryInterval_(retryInterval) {}

std::shared_ptr<HomeScreenConnection> DeviceHomeScreen::blockableConnection() {
    return std::make_shared<Connection>(*this, propertyLists_);
}

TerminationAssertionResult DeviceHomeScreen::takeTerminationAssertion(const std::string& identifier,
                                                                      std::uint64_t /*reason*/) {
    // Most often nothing is installed yet, and nothing has to be written.
    bool installed = true;
    const Status looked = database_.read([&](Database& database) -> Status {
        const Result<bool> answer = isInstalled(database, identifier);
        if (!answer) return answer.error();
        installed = *answer;
        return {};
    });
    if (!looked) return {kCannotTell, nullptr};
    if (!installed) return {TerminationAssertionResult::kNoSuchApplication, nullptr};
    int outcome = kCannotTell;
    const Status asked = database_.change(Durability::Soon, [&](Database& database) {
        return askToEnd(database, identifier, retryInterval_, outcome);
    });
    if (!asked) return {kCannotTell, nullptr};
    if (outcome != TerminationAssertionResult::kGranted) return {outcome, nullptr};
    return {outcome, std::make_unique<Assertion>(database_, identifier)};
}

Result<std::vector<std::string>> DeviceHomeScreen::order() {
    Bytes state;
    std::vector<std::string> arrivals;
    const Status status = database_.read([&](Database& database) -> Status {
        Result<Bytes> stored = storedState(database);
        if (!stored) return stored.error();
        state = std::move(*stored);
        Result<std::vector<std::string>> identifiers = identifiersByArrival(database);
        if (!identifiers) return identifiers.error();
        arrivals = std::move(*identifiers);
        return {};
    });
    if (!status) return status.error();
    IdentifierList list;
    // One that is damaged is none: the applications are there all the same.
    const Result<PropertyList> layout = propertyLists_.parse(state);
    if (layout) {
        for (const PropertyList& element : layout->elements()) {
            if (const std::string* identifier = element.asString()) list.add(*identifier);
        }
    }
    for (const std::string& identifier : arrivals) list.add(identifier);
    return list.take();
}

Status DeviceHomeScreen::setOrder(ByteView state) {
    const Result<PropertyList> layout = propertyLists_.parse(state);
    if (!layout) return stateRefused(layout.error().description());
    if (!layout->isArray()) return stateRefused("it is not an array");
    IdentifierList list;
    for (const PropertyList& element : layout->elements()) {
        const std::string* identifier = element.asString();
        if (identifier == nullptr) return stateRefused("it holds something that is not a string");
        if (isLegalIdentifier(*identifier)) list.add(*identifier);
    }
    const Result<Bytes> bytes =
        propertyLists_.serialize(PropertyList::strings(list.take()), PropertyListFormat::Binary);
    if (!bytes) return stateRefused(bytes.error().description());
    return database_.change(Durability::Soon, [&](Database& database) {
        return database.query("INSERT OR REPLACE INTO icon_layout (id, state) VALUES (1, ?)")
            .bind(*bytes)
            .run();
    });
}

Status markRunning(Database& database, const std::string& identifier, bool assertionsAreStale) {
    const Result<bool> installed = isInstalled(database, identifier);
    if (!installed) return installed.error();
    if (!*installed) {
        return registryError(
            RegistryErrorCode::NothingInstalled,
            identifier + " is not installed, so it cannot run; appsync apps shows what is");
    }
    const Result<bool> held =
        holds(database, "SELECT 1 FROM assertions WHERE identifier = ?", identifier);
    if (!held) return held.error();
    if (*held && !assertionsAreStale) {
        return registryError(RegistryErrorCode::InstallUnderWay,
                             identifier +
                                 " is being updated and cannot run at this moment; try again when "
                                 "that is done");
    }
    return database.query("INSERT OR IGNORE INTO running (identifier) VALUES (?)")
        .bind(identifier)
        .run();
}

Status endRunning(Database& database, const std::string& identifier) {
    const Result<bool> installed = isInstalled(database, identifier);
    if (!installed) return installed.error();
    if (!*installed) {
        return registryError(
            RegistryErrorCode::NothingInstalled,
            identifier + " is not installed, so it does not run; appsync apps shows what is");
    }
    return database.query("DELETE FROM running WHERE identifier = ?").bind(identifier).run();
}

}  // namespace appsync
