#include "simulation/recording/Recorder.h"

#include <array>
#include <ostream>
#include <utility>
#include <variant>

#include "platform/LogRendering.h"
#include "simulation/recording/KnownCalls.h"

namespace appsync {
namespace {

std::string_view levelName(LogLevel level) {
    constexpr std::array<std::string_view, 5> kNames{"default", "info", "debug", "error", "fault"};
    return kNames.at(static_cast<std::size_t>(level));
}

/// How much of a rendered message is the bundle identifier that it begins with, and the bar.
std::size_t prefixLength(const LogMessage& message) {
    if (!message.format.starts_with("%s|") || message.arguments.empty()) return 0;
    const auto* identifier = std::get_if<std::string_view>(&message.arguments.front());
    return identifier == nullptr ? 0 : identifier->size() + 1;
}

}  // namespace

std::string RecordEntry::line() const {
    if (kind == Kind::Message) {
        const std::string number = std::to_string(static_cast<int>(category));
        return number + " " + std::string(levelName(level)) + " " + text;
    }
    const std::string call = service + "." + method + "(" + arguments + ")";
    return result.empty() ? call : call + " -> " + result;
}

std::ostream& operator<<(std::ostream& out, const RecordEntry& entry) {
    return out << entry.line();
}

std::size_t Recorder::begin(std::string_view service, std::string_view method,
                            std::string arguments) {
    scheduler_.switchPoint();
    if (!isListening()) return kNotRecorded;
    RecordEntry entry;
    entry.service = service;
    entry.method = method;
    entry.arguments = std::move(arguments);
    entry.task = scheduler_.currentName();
    entry.time = scheduler_.now();
    const std::string name = entry.service + "." + entry.method;
    if (!isKnownCall(name)) throw SimulationFailure(name + " is missing in KnownCalls.cpp");
    const std::size_t number = enabled_ ? forgotten_ + entries_.size() : kNotRecorded;
    const Hook hook = hookOf(entry);
    if (enabled_) entries_.push_back(entry);
    if (hook) hook(entry);
    if (interceptor_ != nullptr) refusal_ = interceptor_->willCall(entry);
    return number;
}

/// A copy: a hook may end itself.
Recorder::Hook Recorder::hookOf(const RecordEntry& entry) const {
    if (hooks_.empty()) return {};
    auto found = hooks_.find(entry.service + "." + entry.method);
    if (found == hooks_.end()) {
        found = hooks_.find(std::string(withoutNumber(entry.service)) + "." + entry.method);
    }
    return found == hooks_.end() ? Hook{} : found->second;
}

void Recorder::end(std::size_t call, std::string result) {
    if (interceptor_ != nullptr) interceptor_->didCall();
    if (call == kNotRecorded || call < forgotten_) return;
    entries_[call - forgotten_].result = std::move(result);
}

void Recorder::message(const LogMessage& message) {
    scheduler_.switchPoint();
    if (!enabled_) return;
    RecordEntry entry;
    entry.kind = RecordEntry::Kind::Message;
    entry.level = message.level;
    entry.category = message.category;
    entry.format = message.format;
    entry.text = renderLogMessage(message);
    const std::size_t length = prefixLength(message);
    entry.prefix = entry.text.substr(0, length);
    entry.text.erase(0, length);
    entry.task = scheduler_.currentName();
    entry.time = scheduler_.now();
    entries_.push_back(std::move(entry));
}

void Recorder::setHook(std::string call, Hook hook) {
    if (!isKnownCall(call)) throw SimulationFailure("there is no call of the name " + call);
    if (hook) {
        hooks_[std::move(call)] = std::move(hook);
    } else {
        hooks_.erase(call);
    }
}

void Recorder::clear() {
    forgotten_ += entries_.size();
    entries_.clear();
}

}  // namespace appsync
