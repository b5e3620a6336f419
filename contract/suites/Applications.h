#pragma once

namespace appsync {

/// What the suites install, and what there is beside it.
inline constexpr const char* kA = "com.example.a";
inline constexpr const char* kB = "com.example.b";

}  // namespace appsync
