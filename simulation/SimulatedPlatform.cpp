#include "simulation/SimulatedPlatform.h"

#include <algorithm>
#include <utility>

#include "simulation/KnownCalls.h"

namespace appsync {
namespace {

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
    : scheduler(scheduling),
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
