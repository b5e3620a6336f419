#include "checked/CheckedPlatform.h"

#include <utility>

#include "checked/BreachBook.h"
#include "checked/CheckedCoordination.h"
#include "checked/CheckedFiles.h"
#include "checked/CheckedQueues.h"
#include "checked/CheckedRegistry.h"
#include "checked/CheckedServices.h"
#include "checked/CheckedTransfers.h"

namespace appsync {

struct CheckedPlatform::Services {
    Services(const Platform& checked, CheckedPlatformOptions options)
        : platform(checked),
          book(std::make_shared<BreachBook>(std::move(options.sink),
                                            std::move(options.currentThread))),
          registry(checked.registry, checked.queues, book,
                   {options.patience, options.lockPatience}),
          coordination(checked.coordination, checked.queues, book, options.patience),
          host(checked.host, checked.queues, book, options.patience) {}

    const Platform platform;
    const std::shared_ptr<BreachBook> book;  // shared with what comes due after this has gone
    CheckedLog log{platform.log, *book};
    CheckedInstaller installer{platform.installer, *book};
    CheckedPolicy policy{platform.policy, *book};
    CheckedBackup backup{platform.backup, *book};
    CheckedHomeScreen homeScreen{platform.homeScreen, *book};
    CheckedFileSystem files{platform.files, *book};
    CheckedPropertyLists propertyLists{platform.propertyLists, *book};
    CheckedWorkQueues queues{platform.queues, book};
    CheckedRegistry registry;
    CheckedCoordination coordination;
    CheckedSyncHost host;
};

CheckedPlatform::CheckedPlatform(const Platform& platform, CheckedPlatformOptions options)
    : services_(std::make_unique<Services>(platform, std::move(options))) {}

CheckedPlatform::~CheckedPlatform() = default;

Platform CheckedPlatform::services() {
    Services& checked = *services_;
    return {.host = checked.host,
            .log = checked.log,
            .registry = checked.registry,
            .installer = checked.installer,
            .coordination = checked.coordination,
            .policy = checked.policy,
            .backup = checked.backup,
            .homeScreen = checked.homeScreen,
            .icons = checked.platform.icons,
            .transactions = checked.platform.transactions,
            .queues = checked.queues,
            .files = checked.files,
            .propertyLists = checked.propertyLists,
            .notifications = checked.platform.notifications,
            .notificationCenter = checked.platform.notificationCenter};
}

}  // namespace appsync
