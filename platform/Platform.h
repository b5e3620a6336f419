#pragma once

namespace appsync {

class AppRegistry;
class BackupService;
class DevicePolicyService;
class FileSystem;
class HomeScreenService;
class IconRenderer;
class InstallCoordinatorService;
class InstallerService;
class InstallTransactionLog;
class LogFacility;
class NamedNotifications;
class NotificationCenter;
class PropertyListSerialization;
class SyncHost;
class WorkQueues;

/// Everything that the plug-in needs of a device: references, which the client copies. The services
/// belong to whoever makes the client and must outlive it, the work that it has queued included:
/// see `AppsClient::create`.
struct Platform {
    SyncHost& host;
    LogFacility& log;
    AppRegistry& registry;
    InstallerService& installer;
    InstallCoordinatorService& coordination;
    DevicePolicyService& policy;
    BackupService& backup;
    HomeScreenService& homeScreen;
    IconRenderer& icons;
    InstallTransactionLog& transactions;
    WorkQueues& queues;
    FileSystem& files;
    PropertyListSerialization& propertyLists;
    NamedNotifications& notifications;
    NotificationCenter& notificationCenter;
};

}  // namespace appsync
