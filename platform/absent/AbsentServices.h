#pragma once

#include "platform/Platform.h"
#include "platform/absent/NoBackup.h"
#include "platform/absent/NoCoordination.h"
#include "platform/absent/NoHomeScreen.h"
#include "platform/absent/NoIcons.h"
#include "platform/absent/NoLog.h"
#include "platform/absent/NoNotificationCenter.h"
#include "platform/absent/NoNotifications.h"
#include "platform/absent/NoPolicy.h"
#include "platform/absent/NoTransactionLog.h"
#include "platform/absent/NoUninstalledList.h"

namespace appsync {

/// All of them, to begin a port with: it takes the place of one after another.
struct AbsentServices {
    NoBackup backup;
    NoCoordination coordination;
    NoHomeScreen homeScreen;
    NoIcons icons;
    NoLog log;
    NoNotificationCenter notificationCenter;
    NoNotifications notifications;
    NoPolicy policy;
    NoTransactionLog transactions;
    NoUninstalledList uninstalled;

    /// A platform of these and the five services that no client can do without.
    [[nodiscard]] Platform completed(SyncHost& host, AppRegistry& registry, WorkQueues& queues,
                                     FileSystem& files, PropertyListSerialization& propertyLists) {
        return {.host = host,
                .log = log,
                .registry = registry,
                .installer = uninstalled,
                .coordination = coordination,
                .policy = policy,
                .backup = backup,
                .homeScreen = homeScreen,
                .icons = icons,
                .transactions = transactions,
                .queues = queues,
                .files = files,
                .propertyLists = propertyLists,
                .notifications = notifications,
                .notificationCenter = notificationCenter};
    }
};

}  // namespace appsync
