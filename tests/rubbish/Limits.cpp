#include "tests/rubbish/Limits.h"

#include <sys/resource.h>
#include <time.h>

#include <atomic>
#include <cstddef>

#if defined(__SANITIZE_ADDRESS__)
#define APPSYNC_ADDRESS_SANITIZER 1
#elif defined(__SANITIZE_THREAD__)
#define APPSYNC_THREAD_SANITIZER 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define APPSYNC_ADDRESS_SANITIZER 1
#elif __has_feature(thread_sanitizer)
#define APPSYNC_THREAD_SANITIZER 1
#endif
#endif

#ifdef APPSYNC_ADDRESS_SANITIZER
#include <sanitizer/allocator_interface.h>
#endif

namespace appsync {

namespace {

constexpr std::uint64_t kNanoseconds = 1'000'000'000;
[[maybe_unused]] constexpr std::int64_t kMemoryLimit = std::int64_t{64} << 20U;

std::uint64_t processorTime() {
    timespec time = {};
    ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
    return static_cast<std::uint64_t>(time.tv_sec) * kNanoseconds +
           static_cast<std::uint64_t>(time.tv_nsec);
}

#ifdef APPSYNC_ADDRESS_SANITIZER

// What the sanitizer keeps of each reading (freed memory, stacks of fibers) adds up over thousands
// of them. So what counts there is what the reading asks for.
std::atomic<std::int64_t> held{0};
std::atomic<std::int64_t> mostHeld{0};

void noteTaken(const volatile void* /*place*/, std::size_t size) {
    const std::int64_t now = held += static_cast<std::int64_t>(size);
    if (now > mostHeld) mostHeld = now;
}
void noteFreed(const volatile void* place) {
    if (place == nullptr) return;
    held -= static_cast<std::int64_t>(__sanitizer_get_allocated_size(place));
}
[[maybe_unused]] const int hooks = __sanitizer_install_malloc_and_free_hooks(noteTaken, noteFreed);

void beginMemory() { mostHeld = held.load(); }
std::int64_t mostMemory() { return mostHeld; }
std::int64_t memoryNow() { return held; }

#else

std::int64_t mostMemory() {
    rusage usage = {};
    ::getrusage(RUSAGE_SELF, &usage);
    return std::int64_t{usage.ru_maxrss} * 1024;
}
// The most that there ever was cannot be set back: all readings together may not pass the limit.
const std::int64_t memoryAtStart = mostMemory();
void beginMemory() {}
std::int64_t memoryNow() { return memoryAtStart; }

#endif

}  // namespace

Limits::Limits() : begin_(processorTime()), memoryAtBegin_(memoryNow()) { beginMemory(); }

std::string Limits::exceeded() const {
    if (!isSanitized() && processorTime() - begin_ > kNanoseconds) {
        return "it took longer than a second";
    }
#ifdef APPSYNC_THREAD_SANITIZER
    return {};
#else
    if (mostMemory() > memoryAtBegin_ + kMemoryLimit) return "it took more than 64 MiB";
    return {};
#endif
}

bool isSanitized() noexcept {
#if defined(APPSYNC_ADDRESS_SANITIZER) || defined(APPSYNC_THREAD_SANITIZER)
    return true;
#else
    return false;
#endif
}

}  // namespace appsync
