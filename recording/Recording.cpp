#include "recording/Recording.h"

#include <algorithm>

#include "platform/SyncHost.h"

namespace appsync {
namespace {

std::chrono::nanoseconds steadyTime() {
    return std::chrono::steady_clock::now().time_since_epoch();
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
    sink_.write(std::string(text.text()) + '\n');
}

std::uint64_t Recording::newNumber() { return ++numbers_; }

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

void Recording::addContents(const RecordText& record) {
    bool isFirst = true;
    for (const NamedContents& each : record.contents()) {
        if (isKnown(each.sum)) continue;
        kept_.insert(each.sum);
        line_.put(isFirst ? ",\"kept\":[" : ",");
        isFirst = false;
        const std::string_view characters(reinterpret_cast<const char*>(each.bytes.data()),
                                          each.bytes.size());
        RecordText text(nullptr, 0);
        text.addPlain(characters);
        line_.put(text.text());
    }
    if (!isFirst) line_.put(']');
}

void Recording::addText(const RecordText& record) {
    const std::string_view text = record.text();
    if (!record.format()) return line_.put(text);
    line_.put(text.substr(0, record.placeOfFormat()));
    addFormat(record.format()->format);
    line_.put(text.substr(record.placeOfFormat()));
}

void Recording::addFormat(std::string_view format) {
    const auto known = formats_.find(format);
    if (known != formats_.end()) return line_.putNumber(known->second);
    if (isNumberedFormat(format)) formats_.emplace(format, formats_.size() + 1);
    RecordText text(nullptr, 0);
    text.addPlain(format);
    line_.put(text.text());
}

std::size_t Recording::numberOf(const void* thread) {
    return threads_.try_emplace(thread, threads_.size() + 1).first->second;
}

void Recording::write(const RecordText& record) {
    const void* const thread = options_.thread();
    const std::lock_guard guard(mutex_);
    if (!isOver_) writeLine(thread, record);
}

// What another thread has written because of the call is seen here without the lock.
void Recording::writeReturn() {
    const void* const thread = options_.thread();
    if (lastThread_.load(std::memory_order_relaxed) == thread) return;
    RecordText text = newText();
    text.member("back");
    text.add(true);
    const std::lock_guard guard(mutex_);
    if (!isOver_) writeLine(thread, text);
}

void Recording::writeLine(const void* thread, const RecordText& record) {
    lastThread_.store(thread, std::memory_order_relaxed);
    line_.clear();
    line_.put("{\"t\":");
    line_.putNumber(static_cast<std::uint64_t>((options_.clock() - begin_).count()));
    line_.put(",\"w\":");
    line_.putNumber(numberOf(thread));
    line_.put(',');
    addText(record);
    addContents(record);
    for (const ContentSum sum : record.longContents()) remember(sum);
    line_.put("}\n");
    sink_.write(line_.text());
}

void Recording::finish() {
    RecordText text = newText();
    text.member("finished");
    text.add(true);
    const void* const thread = options_.thread();
    const std::lock_guard guard(mutex_);
    if (!isOver_) writeLine(thread, text);
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
