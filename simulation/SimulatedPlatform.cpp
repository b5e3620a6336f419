#include "simulation/SimulatedPlatform.h"

#include <algorithm>
#include <utility>

#include "simulation/DeviceImage.h"
#include "simulation/recording/KnownCalls.h"

namespace appsync {
namespace {

constexpr std::string_view kReceivedFiles = "/var/mobile/Media/PublicStaging";
constexpr std::string_view kTemporaryFiles = "/tmp";
constexpr std::string_view kPackageSuffix = ".zip";
/// In the name of a file that was about to be renamed.
constexpr std::string_view kTemporaryMark = ".appsync-";

/// A package that was delivered to a coordinator, or whose data is yet to come, waits where it is.
void clearPackages(SimulatedPlatform& platform) {
    const std::set<std::string> delivered = platform.coordination.deliveredPackages();
    for (const std::string& name : platform.files.names(std::string(kReceivedFiles))) {
        if (!name.ends_with(kPackageSuffix)) continue;
        const std::string identifier = name.substr(0, name.size() - kPackageSuffix.size());
        const std::string path = std::string(kReceivedFiles) + "/" + name;
        if (platform.backup.restoreData().contains(identifier) || delivered.contains(path)) {
            continue;
        }
        platform.files.remove(path);
    }
}

void clearTemporaries(SimulatedPlatform& platform) {
    platform.files.remove(std::string(kTemporaryFiles));
    platform.files.addDirectory(std::string(kTemporaryFiles));
    for (const char* directory :
         {"/var/mobile/Library/ApplicationSync", kReceivedFiles.data(),
          "/var/mobile/Media/VessikRestore", "/var/mobile/Library/Preferences",
          "/var/containers/Bundle/Application"}) {
        for (const std::string& path : platform.files.paths(directory)) {
            const std::string_view name = std::string_view(path).substr(path.rfind('/') + 1);
            const bool isTemporary =
                name.starts_with('.') && name.find(kTemporaryMark) != std::string_view::npos;
            if (isTemporary) platform.files.remove(path);
        }
    }
}

bool isCall(const RecordEntry& entry) { return entry.kind == RecordEntry::Kind::Call; }
bool isMessage(const RecordEntry& entry) { return entry.kind == RecordEntry::Kind::Message; }

bool isNamed(const RecordEntry& entry, std::string_view name) {
    const std::string kind(withoutNumber(entry.service));
    return name == entry.service || name == entry.service + "." + entry.method || name == kind ||
           name == kind + "." + entry.method;
}

template <typename Filter>
std::vector<std::string> linesOf(const std::vector<RecordEntry>& entries, const Filter& filter) {
    std::vector<std::string> lines;
    for (const RecordEntry& entry : entries) {
        if (filter(entry)) lines.push_back(entry.line());
    }
    return lines;
}

}  // namespace

SimulatedPlatform::SimulatedPlatform(PropertyListSerialization& codec, Scheduling scheduling)
    : scheduler(std::move(scheduling)),
      recorder(scheduler),
      transfers(recorder),
      host(recorder, &transfers),
      log(recorder),
      queues(recorder),
      files(recorder),
      propertyLists(recorder, codec),
      registry(recorder, files, codec),
      installer(recorder),
      coordination(recorder, registry, files),
      policy(recorder),
      backup(recorder),
      homeScreen(recorder, registry, codec),
      icons(recorder),
      transactions(recorder),
      notifications(recorder),
      notificationCenter(recorder) {}

// Work that has not begun may hold what calls the services when it is destroyed.
SimulatedPlatform::~SimulatedPlatform() { scheduler.shutDown(); }

Platform SimulatedPlatform::services() {
    return {host,   log,    registry,      installer,     coordination,
            policy, backup, homeScreen,    icons,         transactions,
            queues, files,  propertyLists, notifications, notificationCenter};
}

std::vector<std::string> SimulatedPlatform::lines() const {
    return linesOf(recording(), [](const RecordEntry&) { return true; });
}

std::vector<std::string> SimulatedPlatform::calls() const { return linesOf(recording(), isCall); }

std::vector<std::string> SimulatedPlatform::callsTo(
    std::initializer_list<std::string_view> names) const {
    for (const std::string_view name : names) {
        if (isKnownService(name) || isKnownCall(name)) continue;
        throw SimulationFailure("there is no service and no call of the name " + std::string(name));
    }
    return linesOf(recording(), [names](const RecordEntry& entry) {
        return isCall(entry) && std::any_of(names.begin(), names.end(), [&](std::string_view name) {
                   return isNamed(entry, name);
               });
    });
}

std::vector<std::string> SimulatedPlatform::messages() const {
    std::vector<std::string> texts;
    for (const RecordEntry& entry : recording()) {
        if (isMessage(entry)) texts.push_back(entry.text);
    }
    return texts;
}

std::vector<std::string> SimulatedPlatform::messageLines() const {
    return linesOf(recording(), isMessage);
}

bool SimulatedPlatform::hasMessage(LogLevel level, LogCategory category,
                                   std::string_view text) const {
    return std::any_of(recording().begin(), recording().end(), [&](const RecordEntry& entry) {
        return isMessage(entry) && entry.level == level && entry.category == category &&
               entry.text == text;
    });
}

std::size_t SimulatedPlatform::countMessages(std::string_view text) const {
    return static_cast<std::size_t>(std::count_if(
        recording().begin(), recording().end(),
        [text](const RecordEntry& entry) { return isMessage(entry) && entry.text == text; }));
}

void SimulatedPlatform::onCall(std::string call, Recorder::Hook hook) {
    recorder.setHook(std::move(call), std::move(hook));
}

void SimulatedPlatform::reopen(const DeviceImage& image) {
    files.load(*image.files);
    coordination.setEnabled(image.records.isCoordinated);
    registry.reopen(image.records.registry, image.powerWasLost);
    coordination.reopen(image.records.coordination);
    installer.setUninstalled(image.records.uninstalled);
    // The install of an application takes its data along.
    std::set<std::string> restoreData = image.records.restoreData;
    std::erase_if(restoreData, [this](const auto& each) { return registry.installed(each); });
    backup.setRestoreData(std::move(restoreData));
    homeScreen.setLayout(image.records.layout);
    clearPackages(*this);
    clearTemporaries(*this);
}

void SimulatedPlatform::addPropertyList(const std::string& path, const PropertyList& value,
                                        PropertyListFormat format) {
    const Result<Bytes> bytes = propertyLists.codec().serialize(value, format);
    if (!bytes)
        throw SimulationFailure("cannot write " + path + ": " + bytes.error().description());
    files.addFile(path, *bytes);
}

std::optional<PropertyList> SimulatedPlatform::propertyListAt(const std::string& path) {
    const std::optional<Bytes> bytes = files.contents(path);
    if (!bytes) return std::nullopt;
    Result<PropertyList> value = propertyLists.codec().parse(*bytes);
    if (!value) return std::nullopt;
    return *std::move(value);
}

}  // namespace appsync
