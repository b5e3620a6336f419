#include <gtest/gtest.h>

#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

using DeviceMomentTest = DeviceFixture;

// What single questions tell of an application.
void expectSame(Device& device, const std::string& identifier, const ApplicationStatus& status) {
    const Result<ApplicationStatus> told = device.status(identifier);
    ASSERT_TRUE(told.ok());
    ASSERT_EQ(status.installed.has_value(), told->installed.has_value());
    if (told->installed) {
        EXPECT_EQ(status.installed->version, told->installed->version);
    }
    ASSERT_EQ(status.placeholder.has_value(), told->placeholder.has_value());
    if (told->placeholder) {
        EXPECT_EQ(status.placeholder->container, told->placeholder->container);
        EXPECT_EQ(status.placeholder->progress.has_value(),
                  told->placeholder->progress.has_value());
    }
    EXPECT_EQ(status.isRunning, told->isRunning);
    EXPECT_EQ(status.awaitsRestoreData, told->awaitsRestoreData);
    EXPECT_EQ(status.sessionUnderWay, told->sessionUnderWay);
    EXPECT_EQ(status.uninstalled.has_value(), told->uninstalled.has_value());
}

TEST_F(DeviceMomentTest, TellsWhatSingleQuestionsDo) {
    ASSERT_TRUE(install("com.a").ok());
    ASSERT_TRUE(install("com.b", "2.0").ok());
    ASSERT_TRUE(installPlaceholder("com.b").ok());
    ASSERT_TRUE(installPlaceholder("com.c", kInstallTypeRestore).ok());
    ASSERT_TRUE(device().run("com.a").ok());
    ASSERT_TRUE(device().setRestoreDataExpected("com.c", true).ok());
    const std::unique_ptr<Device> looking = look();
    const Result<DeviceMoment> moment = looking->moment();
    ASSERT_TRUE(moment.ok());
    EXPECT_TRUE(moment->session.isUnderWay);
    EXPECT_TRUE(moment->session.since);
    ASSERT_EQ(moment->applications.size(), 3U);
    for (const auto& [identifier, status] : moment->applications) {
        SCOPED_TRACE(identifier);
        expectSame(*looking, identifier, status);
    }
    EXPECT_TRUE(moment->applications.at("com.a").isRunning);
    EXPECT_TRUE(moment->applications.at("com.b").placeholder);
}

TEST_F(DeviceMomentTest, OfADeviceAtRest) {
    ASSERT_TRUE(install("com.a").ok());
    close();
    const Result<DeviceMoment> moment = look()->moment();
    ASSERT_TRUE(moment.ok());
    EXPECT_FALSE(moment->session.isUnderWay);
    EXPECT_FALSE(moment->session.since);
    EXPECT_FALSE(moment->applications.at("com.a").sessionUnderWay);
}

}  // namespace
}  // namespace appsync
