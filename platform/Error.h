#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/PropertyList.h"

namespace appsync {

/// Domain of errors whose code is an errno value of the operating system.
inline constexpr std::string_view kPosixErrorDomain = "POSIX";
/// Domain of errors that the plug-in makes.
inline constexpr std::string_view kSyncErrorDomain = "TRError";
/// Domain of errors of the AppRegistry.
inline constexpr std::string_view kRegistryErrorDomain = "RegistaError";
/// Domain of errors of the InstallerService: a package that cannot be read or is refused.
inline constexpr std::string_view kInstallerErrorDomain = "InstallerService";
/// Domain of errors of property-list readers and writers.
inline constexpr std::string_view kPropertyListErrorDomain = "PropertyList";

/// The code of "invalid argument" in the POSIX domain.
inline constexpr std::int64_t kPosixInvalidArgument = 22;

/// An error as it crosses interfaces: who says it (domain), which one (code), and what a person or
/// a program may want to know (a map, or null when there is nothing). Under the key "description"
/// of the user information stands one sentence for people, where there is one.
struct ErrorRecord {
    std::string domain;
    std::int64_t code = 0;
    PropertyList userInfo;

    /// An error with a sentence for people.
    [[nodiscard]] static ErrorRecord make(std::string_view domain, std::int64_t code,
                                          std::string_view description);

    /// The sentence for people; "domain error code" when there is none.
    [[nodiscard]] std::string description() const;

    /// The same error, its sentence preceded by "context: ".
    [[nodiscard]] ErrorRecord withContext(std::string_view context) const;

    friend bool operator==(const ErrorRecord&, const ErrorRecord&) = default;
};

/// Where an entry point leaves its error; null when the caller does not ask for one.
using ErrorOut = std::optional<ErrorRecord>*;

}  // namespace appsync
