#include "simulation/scheduling/Fiber.h"

#include <cxxabi.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>
#include <vector>

#if defined(__SANITIZE_ADDRESS__)
#define APPSYNC_ADDRESS_SANITIZER 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define APPSYNC_ADDRESS_SANITIZER 1
#endif
#endif

#if defined(__SANITIZE_THREAD__)
#define APPSYNC_THREAD_SANITIZER 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define APPSYNC_THREAD_SANITIZER 1
#endif
#endif

#ifdef APPSYNC_ADDRESS_SANITIZER
#include <sanitizer/asan_interface.h>
#include <sanitizer/common_interface_defs.h>
#endif
#ifdef APPSYNC_THREAD_SANITIZER
#include <sanitizer/tsan_interface.h>
#endif

namespace appsync {
namespace {

constexpr std::size_t kStackSize = std::size_t{512} * 1024;

// The switch under way, or the last one: both ends need to know the other.
thread_local Fiber* switchingFrom = nullptr;
thread_local Fiber* switchingTo = nullptr;

/// The exceptions that the running flow of control is handling: the runtime keeps them per thread.
class ExceptionState {
  public:
    ExceptionState() { std::memcpy(saved_.data(), abi::__cxa_get_globals(), saved_.size()); }
    void restore() const { std::memcpy(abi::__cxa_get_globals(), saved_.data(), saved_.size()); }

  private:
    struct Layout {
        void* caught;
        unsigned int uncaught;
    };
    std::array<std::byte, sizeof(Layout)> saved_;
};

using Stack = std::unique_ptr<std::byte[]>;

/// Stacks of fibers that are gone: making one costs more than most fibers do. Never destroyed,
/// because fibers may outlive it.
std::vector<Stack>& freeStacks() {
    thread_local auto& stacks = *new std::vector<Stack>;
    return stacks;
}

Stack takeStack() {
    std::vector<Stack>& stacks = freeStacks();
    if (stacks.empty()) return std::make_unique_for_overwrite<std::byte[]>(kStackSize);
    Stack stack = std::move(stacks.back());
    stacks.pop_back();
    return stack;
}

void giveBack(Stack stack) {
#ifdef APPSYNC_ADDRESS_SANITIZER
    // Frames that were never left have marked their surroundings.
    __asan_unpoison_memory_region(stack.get(), kStackSize);
#endif
    freeStacks().push_back(std::move(stack));
}

}  // namespace

Fiber::Fiber() {
#ifdef APPSYNC_THREAD_SANITIZER
    sanitizerState_ = __tsan_get_current_fiber();
#endif
}

Fiber::Fiber(std::function<void()> body)
    : body_(std::move(body)),
      stack_(takeStack()),
      stackBottom_(stack_.get()),
      stackSize_(kStackSize) {
    getcontext(&context_);
    context_.uc_stack.ss_sp = stack_.get();
    context_.uc_stack.ss_size = kStackSize;
    context_.uc_link = nullptr;
    makecontext(&context_, &Fiber::enter, 0);
#ifdef APPSYNC_THREAD_SANITIZER
    sanitizerState_ = __tsan_create_fiber(0);
#endif
}

Fiber::~Fiber() {
#ifdef APPSYNC_THREAD_SANITIZER
    if (stack_ != nullptr) __tsan_destroy_fiber(sanitizerState_);
#endif
    if (stack_ != nullptr) giveBack(std::move(stack_));
}

void Fiber::switchTo(Fiber& other) {
    if (&other == this) return;
    const ExceptionState exceptions;
    switchingFrom = this;
    switchingTo = &other;
#ifdef APPSYNC_ADDRESS_SANITIZER
    __sanitizer_start_switch_fiber(&sanitizerState_, other.stackBottom_, other.stackSize_);
#endif
#ifdef APPSYNC_THREAD_SANITIZER
    __tsan_switch_to_fiber(other.sanitizerState_, 0);
#endif
    swapcontext(&context_, &other.context_);
    arrived();
    exceptions.restore();
}

void Fiber::arrived() {
#ifdef APPSYNC_ADDRESS_SANITIZER
    // The stack that was left: only now is the one of the thread itself known.
    __sanitizer_finish_switch_fiber(sanitizerState_, &switchingFrom->stackBottom_,
                                    &switchingFrom->stackSize_);
#endif
}

void Fiber::enter() {
    Fiber& self = *switchingTo;
    self.arrived();
    std::memset(abi::__cxa_get_globals(), 0, sizeof(ExceptionState));
    self.body_();
    std::abort();  // a body never returns
}

}  // namespace appsync
