#include "platform/SyncHost.h"

#include <gtest/gtest.h>

#include "platform/Error.h"

namespace appsync {
namespace {

/// A host that says no more than it must.
class PlainHost : public SyncHost {
  public:
    [[nodiscard]] std::string mainBundleIdentifier() const override { return "com.example.host"; }
    [[nodiscard]] std::string pluginBundleIdentifier() const override { return "com.example.plug"; }
    [[nodiscard]] bool isRecoverableError(const ErrorRecord&) const override { return false; }
};

TEST(SyncHost, HasNoDeviceServiceUnlessItSaysSo) {
    PlainHost host;
    EXPECT_EQ(host.transferService(), nullptr);
}

}  // namespace
}  // namespace appsync
