#pragma once

#include <ucontext.h>

#include <cstddef>
#include <functional>
#include <memory>

namespace appsync {

/// A flow of control with a stack of its own, on the thread that made it. Switching is explicit.
///
/// Known to AddressSanitizer and ThreadSanitizer when built with them; exceptions that are being
/// handled stay with their fiber. Not for use by more than one thread.
class Fiber {
  public:
    /// The flow of control that calls: the stack that is there already.
    Fiber();
    /// A new one that runs `body` when it is first switched to. `body` never returns.
    explicit Fiber(std::function<void()> body);
    ~Fiber();

    Fiber(const Fiber&) = delete;
    Fiber& operator=(const Fiber&) = delete;

    /// Suspends this fiber, which must be the one that runs, and runs the other. Returns when
    /// somebody switches back.
    void switchTo(Fiber& other);

  private:
    static void enter();
    void arrived();

    std::function<void()> body_;
    std::unique_ptr<std::byte[]> stack_;
    ucontext_t context_{};
    // For the sanitizers.
    [[maybe_unused]] void* sanitizerState_ = nullptr;
    [[maybe_unused]] const void* stackBottom_ = nullptr;
    [[maybe_unused]] std::size_t stackSize_ = 0;
};

}  // namespace appsync
