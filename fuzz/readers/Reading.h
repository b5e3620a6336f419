#pragma once

#include <string>
#include <utility>

#include "platform/Bytes.h"

namespace appsync {

/// What a reader made of foreign bytes: it has read something, or it has refused them.
struct Reading {
    bool wasRead = false;
    /// Why it has refused them, for people. Never empty then.
    std::string refusal;
    /// What is promised of every input and did not hold for this one; empty when all held.
    std::string broken;

    [[nodiscard]] static Reading read() { return {true, {}, {}}; }
    /// A refusal must say why.
    [[nodiscard]] static Reading refused(std::string why) {
        Reading reading{false, std::move(why), {}};
        if (reading.refusal.empty()) reading.broken = "it was refused without a word";
        return reading;
    }
    /// The same reading, of which something that was promised does not hold.
    [[nodiscard]] Reading unless(bool holds, std::string promise) && {
        if (!holds && broken.empty()) broken = std::move(promise);
        return std::move(*this);
    }
};

using Reader = Reading (*)(ByteView);

}  // namespace appsync
