#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>

#include "client/LogFormat.h"
#include "platform/LogFacility.h"

namespace appsync {

struct Platform;
class SyncHost;

using Level = LogLevel;

/// The argument as it is handed to the log facility, borrowed. A null pointer and an empty optional
/// are the missing object.
template <typename T>
LogArgument logArgument(const T& value) {
    if constexpr (std::is_same_v<T, PropertyList> || std::is_same_v<T, ErrorRecord>) {
        return &value;
    } else if constexpr (std::is_same_v<T, std::nullptr_t>) {
        return nullptr;
    } else if constexpr (logArgumentKind<T>() == LogArgumentKind::Real) {
        return double{value};
    } else if constexpr (logArgumentKind<T>() == LogArgumentKind::Unsigned) {
        return std::uint64_t{value};
    } else if constexpr (logArgumentKind<T>() != LogArgumentKind::Object) {
        return std::int64_t{value};
    } else {
        return std::string_view(value);
    }
}
template <typename T>
LogArgument logArgument(const std::optional<T>& value) {
    return value ? logArgument(*value) : LogArgument(nullptr);
}
template <typename T>
requires(!std::is_same_v<T, char>) LogArgument logArgument(const T* value) {
    return value != nullptr ? logArgument(*value) : LogArgument(nullptr);
}

/// Writes messages to the SyncHost's log facility, in the plug-in's name: the argument of the "%s|"
/// with which a format begins, the plug-in's bundle identifier, is filled in here.
///
///     log(Level::Default, "%s|Received file at %{public}@", path);
///
/// A format that does not fit its arguments does not compile. Cheap to make and to copy; callable
/// on any thread; must not outlive the platform.
class Log {
  public:
    explicit Log(const Platform& platform);

    /// A message of category 8.
    template <typename... Arguments>
    void operator()(Level level, LogFormat<true, std::type_identity_t<Arguments>...> format,
                    const Arguments&... arguments) const {
        writePrefixed(LogCategory::Coordination, level, format.text(), arguments...);
    }

    /// A message of category 14.
    template <typename... Arguments>
    void applications(Level level, LogFormat<true, std::type_identity_t<Arguments>...> format,
                      const Arguments&... arguments) const {
        writePrefixed(LogCategory::Applications, level, format.text(), arguments...);
    }

    /// A message of the host's general category, 0: it has no prefix.
    template <typename... Arguments>
    void general(Level level, LogFormat<false, std::type_identity_t<Arguments>...> format,
                 const Arguments&... arguments) const {
        const std::array<LogArgument, sizeof...(Arguments)> all{logArgument(arguments)...};
        facility_.write({LogCategory::General, level, format.text(), all});
    }

  private:
    template <typename... Arguments>
    void writePrefixed(LogCategory category, Level level, std::string_view format,
                       const Arguments&... arguments) const {
        const std::string plugin = pluginBundleIdentifier();
        const std::array<LogArgument, 1 + sizeof...(Arguments)> all{logArgument(plugin),
                                                                    logArgument(arguments)...};
        facility_.write({category, level, format, all});
    }

    [[nodiscard]] std::string pluginBundleIdentifier() const;

    LogFacility& facility_;
    const SyncHost& host_;
};

/// A boolean as messages print it with %c.
[[nodiscard]] constexpr char yesOrNo(bool value) { return value ? 'y' : 'n'; }

}  // namespace appsync
