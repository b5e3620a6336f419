#include "recording/RecordingPlatform.h"

#include "platform/SyncHost.h"
#include "recording/RecordedCoordination.h"
#include "recording/RecordedFiles.h"
#include "recording/RecordedQueues.h"
#include "recording/RecordedRegistry.h"
#include "recording/RecordedServices.h"

namespace appsync {

struct RecordingPlatform::Services {
    Services(const Platform& inner, Recording& recording)
        : host(inner.host, recording),
          log(inner.log, inner.host.pluginBundleIdentifier(), recording),
          registry(inner.registry, recording),
          installer(inner.installer, recording),
          coordination(inner.coordination, recording),
          policy(inner.policy, recording),
          backup(inner.backup, recording),
          homeScreen(inner.homeScreen, recording),
          icons(inner.icons, recording),
          transactions(inner.transactions, recording),
          queues(inner.queues, recording),
          files(inner.files, recording),
          propertyLists(inner.propertyLists, recording),
          notifications(inner.notifications, recording),
          notificationCenter(inner.notificationCenter, recording) {}

    RecordedHost host;
    RecordedLog log;
    RecordedRegistry registry;
    RecordedInstaller installer;
    RecordedCoordination coordination;
    RecordedPolicy policy;
    RecordedBackup backup;
    RecordedHomeScreen homeScreen;
    RecordedIcons icons;
    RecordedTransactions transactions;
    RecordedQueues queues;
    RecordedFiles files;
    RecordedPropertyLists propertyLists;
    RecordedNotifications notifications;
    RecordedNotificationCenter notificationCenter;
    const Platform platform{host,   log,    registry,      installer,     coordination,
                            policy, backup, homeScreen,    icons,         transactions,
                            queues, files,  propertyLists, notifications, notificationCenter};
};

RecordingPlatform::RecordingPlatform(const Platform& platform, Recording& recording)
    : services_(std::make_unique<Services>(platform, recording)) {}

RecordingPlatform::~RecordingPlatform() = default;

const Platform& RecordingPlatform::services() const { return services_->platform; }

}  // namespace appsync
