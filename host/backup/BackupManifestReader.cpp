#include "host/backup/BackupManifestReader.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <set>
#include <utility>
#include <variant>
#include <vector>

#include "device/values/PackageIdentifier.h"
#include "host/backup/BackupManifestKeys.h"
#include "host/console/JsonReading.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

constexpr std::size_t kDeepest = 8;  // twice as deep as anything in a manifest

constexpr std::string_view kBadApplication = "an application in it is not as it should be";

// Where a file of the manifest may stand: one of the three lists, or an archive of data.
bool isBackupFile(const std::string& name) {
    if (name == kBackupRestoreInfo || name == kBackupDemotedApps || name == kBackupIconOrder) {
        return true;
    }
    return identifierOfData(name).has_value();
}

bool isSum(const std::string& text) {
    return text.size() == 64 && text.find_first_not_of("0123456789abcdef") == text.npos;
}

bool namesTwice(const std::vector<BackedUpApplication>& applications) {
    std::set<std::string_view> seen;
    return std::any_of(applications.begin(), applications.end(),
                       [&](const auto& each) { return !seen.insert(each.identifier).second; });
}

// The scalars of a map, by the names that a manifest knows there.
template <std::size_t count>
class Members {
  public:
    explicit Members(const std::array<std::string_view, count>& names) : names_(names) {}

    void clear() {
        values_.fill({});
        seen_.fill(false);
    }
    // False when the map has that member already.
    bool begin(std::string_view name) {
        const auto found = std::ranges::find(names_, name);
        current_ = static_cast<std::size_t>(found - names_.begin());
        return current_ == count || !std::exchange(seen_.at(current_), true);
    }
    [[nodiscard]] bool isAt(std::string_view name) const {
        return current_ != count && names_.at(current_) == name;
    }
    void set(JsonScalar&& value) {
        if (current_ != count) values_.at(current_) = std::move(value);
    }
    // The value, if it is of that kind.
    template <typename Value>
    [[nodiscard]] std::optional<Value> get(std::string_view name) const {
        const auto found =
            static_cast<std::size_t>(std::ranges::find(names_, name) - names_.begin());
        const Value* value = std::get_if<Value>(&values_.at(found));
        return value != nullptr ? std::optional(*value) : std::nullopt;
    }

  private:
    const std::array<std::string_view, count>& names_;
    std::array<JsonScalar, count> values_;
    std::array<bool, count> seen_{};
    std::size_t current_ = count;  // the member that has begun; `count` for one that is not known
};

constexpr std::array<std::string_view, 4> kRootNames = {kFormatKey, kMadeKey, kApplicationsKey,
                                                        kFilesKey};
constexpr std::array<std::string_view, 4> kApplicationNames = {kIdentifierKey, kVersionKey,
                                                               kNameKey, kDataKey};
constexpr std::array<std::string_view, 2> kFileNames = {kSizeKey, kSumKey};

// Takes the manifest from its text piece by piece. The format decides whether what is odd in the
// rest is a defect, and it may come last.
class ManifestListener final : public JsonListener {
  public:
    explicit ManifestListener(BackupManifest& manifest) : manifest_(manifest) {}

    bool memberBegins(std::string name) override {
        switch (here()) {
            case Place::Root:
                return root_.begin(name) || stopAtRepetition();
            case Place::Application:
                return application_.begin(name) || stopAtRepetition();
            case Place::File:
                return file_.begin(name) || stopAtRepetition();
            case Place::Files:
                return beginFile(std::move(name));
            default:
                return true;
        }
    }

    bool scalar(JsonScalar value) override {
        switch (here()) {
            case Place::Root:
                root_.set(std::move(value));
                break;
            case Place::Application:
                application_.set(std::move(value));
                break;
            case Place::File:
                file_.set(std::move(value));
                break;
            default:
                noteOddPart();
        }
        return true;
    }

    bool objectBegins() override {
        switch (here()) {
            case Place::Outside:
                return open(Place::Root);
            case Place::Root:
                return open(root_.isAt(kFilesKey) ? Place::Files : Place::Elsewhere);
            case Place::Applications:
                application_.clear();
                return open(Place::Application);
            case Place::Files:
                file_.clear();
                return open(Place::File);
            default:
                return open(Place::Elsewhere);
        }
    }

    bool arrayBegins() override {
        noteOddPart();
        const bool isList = here() == Place::Root && root_.isAt(kApplicationsKey);
        return open(isList ? Place::Applications : Place::Elsewhere);
    }

    bool containerEnds() override {
        const Place ended = here();
        open_.pop_back();
        if (ended == Place::Application) endApplication();
        if (ended == Place::File) endFile();
        return true;
    }

    // Why the reading was stopped; empty when it was not.
    [[nodiscard]] const std::string& stop() const { return stop_; }

    // Why the manifest cannot be used, when all was read; empty when it can.
    std::string defect() {
        const std::string format = formatDefect();
        if (!format.empty()) return format;
        manifest_.made = root_.get<std::string>(kMadeKey).value_or("");
        if (!hasApplications_) return "it lists no applications";
        if (!hasFiles_) return "it lists no files";
        if (isAnApplicationOdd_) return std::string(kBadApplication);
        if (namesTwice(manifest_.applications)) return "it lists an application twice";
        if (!fileDefect_.empty()) return fileDefect_;
        return manifest_.holds(kBackupRestoreInfo) ? ""
                                                   : "it does not name the restore information";
    }

  private:
    enum class Place { Outside, Root, Applications, Application, Files, File, Elsewhere };

    [[nodiscard]] Place here() const { return open_.empty() ? Place::Outside : open_.back(); }

    bool open(Place place) {
        if (open_.size() == kDeepest) {
            stop_ = "it nests deeper than a manifest does";
            return false;
        }
        hasApplications_ = hasApplications_ || place == Place::Applications;
        hasFiles_ = hasFiles_ || place == Place::Files;
        open_.push_back(place);
        return true;
    }

    bool stopAtRepetition() {
        stop_ = "it names something twice";
        return false;
    }

    // In the place of a map there is something else.
    void noteOddPart() {
        if (here() == Place::Applications) isAnApplicationOdd_ = true;
        if (here() == Place::Files) noteFileDefect(" has no size or no sum");
    }

    void endApplication() {
        const auto identifier = application_.get<std::string>(kIdentifierKey);
        const auto data = application_.get<bool>(kDataKey);
        isAnApplicationOdd_ =
            isAnApplicationOdd_ || !identifier || !isLegalIdentifier(*identifier) || !data;
        if (isAnApplicationOdd_) return;
        manifest_.applications.push_back(
            {*identifier, application_.get<std::string>(kVersionKey),
             application_.get<std::string>(kNameKey).value_or(*identifier), *data});
    }

    bool beginFile(std::string name) {
        fileName_ = std::move(name);
        if (manifest_.files.contains(fileName_)) return stopAtRepetition();
        if (!isBackupFile(fileName_)) {
            noteFileDefect(", which is no file of a backup", "it names ");
        }
        return true;
    }

    void endFile() {
        const auto size = file_.get<std::uint64_t>(kSizeKey);
        const auto sum = file_.get<std::string>(kSumKey);
        if (!size || !sum || !isSum(*sum)) noteFileDefect(" has no size or no sum");
        if (fileDefect_.empty()) manifest_.files[fileName_] = {*size, *sum};
    }

    // The first defect stays.
    void noteFileDefect(std::string_view what, std::string_view before = "its file ") {
        if (fileDefect_.empty()) {
            fileDefect_ = std::string(before) + printable(fileName_) + std::string(what);
        }
    }

    [[nodiscard]] std::string formatDefect() const {
        const auto number = root_.get<std::int64_t>(kFormatKey);
        const auto unsignedNumber = root_.get<std::uint64_t>(kFormatKey);
        if (!number && !unsignedNumber) return "it tells no format";
        if (unsignedNumber == kBackupFormat) return "";
        return "this version does not know its format " +
               (number ? std::to_string(*number) : std::to_string(*unsignedNumber));
    }

    BackupManifest& manifest_;
    std::vector<Place> open_;  // of the containers that have begun, the innermost last
    Members<4> root_{kRootNames};
    Members<4> application_{kApplicationNames};
    Members<2> file_{kFileNames};
    std::string fileName_;
    std::string fileDefect_;
    std::string stop_;
    bool isAnApplicationOdd_ = false;
    bool hasApplications_ = false;
    bool hasFiles_ = false;
};

}  // namespace

std::string readManifestText(std::string_view text, BackupManifest& manifest) {
    ManifestListener listener(manifest);
    if (readJson(text, listener)) return listener.defect();
    return listener.stop().empty() ? "it is not JSON" : listener.stop();
}

}  // namespace appsync
