#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/Bytes.h"
#include "simulation/scheduling/Scheduler.h"

namespace appsync {

/// An item of the simulated file system. Kept small: there are tens of thousands of them in the
/// largest tests.
struct FileNode {
    enum class Kind { Directory, File, Link, Pipe };
    using Pointer = std::shared_ptr<FileNode>;
    using Contents = std::shared_ptr<const Bytes>;  // copies of a file share theirs
    using Children = std::map<std::string, Pointer, std::less<>>;

    [[nodiscard]] std::uint64_t bytes() const {
        std::uint64_t sum = kind == Kind::File ? contents->size() : 0;
        for (const auto& [name, child] : children) sum += child->bytes();
        return sum;
    }

    [[nodiscard]] bool holds(const FileNode* other) const {
        if (this == other) return true;
        for (const auto& [name, child] : children) {
            if (child->holds(other)) return true;
        }
        return false;
    }

    Kind kind = Kind::File;
    const std::string* owner = nullptr;  // outlives every file system
    const std::string* group = nullptr;
    SimulatedTime modified{0};
    Contents contents;  // of a link: where it points
    Children children;
};

}  // namespace appsync
