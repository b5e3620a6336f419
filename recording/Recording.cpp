#include "recording/Recording.h"

#include <algorithm>
#include <array>
#include <charconv>

#include "platform/SyncHost.h"

namespace appsync {
namespace {

std::chrono::nanoseconds steadyTime() {
    return std::chrono::steady_clock::now().time_since_epoch();
}

void appendNumber(std::string& line, std::uint64_t number) {
    constexpr std::size_t kLongest = 20;
    std::array<char, kLongest> digits{};
    line.append(digits.data(),
                std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr);
}

const void* threadOfMachine() {
    static thread_local const char here = 0;
    return &here;
}

}  // namespace

Recording::Recording(RecordingSink& sink, const SyncHost& host, const std::string& plugInVersion,
                     RecordingOptions options)
    : sink_(sink), options_(std::move(options)) {
    if (!options_.clock) options_.clock = steadyTime;
    if (!options_.thread) options_.thread = threadOfMachine;
    begin_ = options_.clock();
    RecordText text = newText();
    text.begin('{');
    text.member("recording");
    text.add(kRecordingVersion);
    text.member("plug-in");
    text.addPlain(plugInVersion);
    text.member("process");
    text.add(host.mainBundleIdentifier());
    text.member("bundle");
    text.add(host.pluginBundleIdentifier());
    text.member("anonymous");
    text.add(options_.isAnonymous);
    text.end('}');
    sink_.write(text.text() + '\n');
}

std::uint64_t Recording::newNumber() {
    const std::lock_guard guard(mutex_);
    return ++numbers_;
}

RecordText Recording::newText() {
    return {options_.isAnonymous ? &anonymizer_ : nullptr, kPassedContentLimit};
}

bool Recording::isKnown(ContentSum sum) const {
    return kept_.contains(sum) || std::find(passed_.begin(), passed_.end(), sum) != passed_.end();
}

void Recording::remember(ContentSum sum) {
    passed_.push_back(sum);
    if (passed_.size() > kRememberedContents) passed_.pop_front();
}

void Recording::addContents(const RecordText& record, std::string& line) {
    bool isFirst = true;
    for (const NamedContents& each : record.contents()) {
        if (isKnown(each.sum)) continue;
        kept_.insert(each.sum);
        line += isFirst ? ",\"kept\":[" : ",";
        isFirst = false;
        const std::string_view characters(reinterpret_cast<const char*>(each.bytes.data()),
                                          each.bytes.size());
        RecordText text(nullptr, 0);
        text.addPlain(characters);
        line += text.text();
    }
    if (!isFirst) line += ']';
}

std::size_t Recording::threadNumber() {
    return threads_.try_emplace(options_.thread(), threads_.size() + 1).first->second;
}

void Recording::write(const RecordText& record) {
    const std::lock_guard guard(mutex_);
    if (!isOver_) writeLine(threadNumber(), record);
}

void Recording::writeReturn() {
    const std::lock_guard guard(mutex_);
    const std::size_t thread = threadNumber();
    if (isOver_ || lastThread_ == thread) return;
    RecordText text = newText();
    text.member("back");
    text.add(true);
    writeLine(thread, text);
}

void Recording::writeLine(std::size_t thread, const RecordText& record) {
    lastThread_ = thread;
    line_ = "{\"t\":";
    appendNumber(line_, static_cast<std::uint64_t>((options_.clock() - begin_).count()));
    line_ += ",\"w\":";
    appendNumber(line_, thread);
    line_ += ',';
    line_ += record.text();
    addContents(record, line_);
    for (const ContentSum sum : record.longContents()) remember(sum);
    line_ += "}\n";
    sink_.write(line_);
}

void Recording::finish() {
    RecordText text = newText();
    text.member("finished");
    text.add(true);
    const std::lock_guard guard(mutex_);
    if (!isOver_) writeLine(threadNumber(), text);
    isOver_ = true;
}

void SpanRecord::end(const RecordText* answer) {
    isWritten_ = true;
    RecordText text = recording_.newText();
    text.member("end");
    text.add(true);
    if (answer != nullptr) {
        text.member("r");
        text.add(*answer);
    }
    recording_.write(text);
}

}  // namespace appsync
