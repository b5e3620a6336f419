#include "contract/OptionalServices.h"

namespace appsync {

std::string_view nameOf(OptionalService service) {
    switch (service) {
        case OptionalService::Coordination:
            return "coordination";
        case OptionalService::Transfers:
            return "transfer service";
        case OptionalService::HomeScreen:
            return "home screen";
        case OptionalService::Icons:
            return "icons";
        case OptionalService::Policy:
            return "policy";
        case OptionalService::Backup:
            return "backup";
        case OptionalService::UninstalledList:
            return "uninstalled list";
        case OptionalService::TransactionLog:
            return "transaction log";
        case OptionalService::Notifications:
            return "named notifications";
        case OptionalService::NotificationCenter:
            return "notification center";
        case OptionalService::CancelByPerson:
            return "cancelling by a person";
    }
    return "?";
}

std::string_view meaningOfAbsence(OptionalService service) {
    switch (service) {
        case OptionalService::Coordination:
            return "installs go directly through the registry; one that is interrupted does not go "
                   "on by itself";
        case OptionalService::Transfers:
            return "the transfer of a cancelled install goes on to its end, and none is brought "
                   "forward";
        case OptionalService::HomeScreen:
            return "the host's icon layout is dropped, and an install waits for no application to "
                   "end";
        case OptionalService::Icons:
            return "placeholders and assets have no icon but the artwork that the host sent";
        case OptionalService::Policy:
            return "installing and removing are always allowed";
        case OptionalService::Backup:
            return "a restored application is installed without waiting for its data";
        case OptionalService::UninstalledList:
            return "the host does not learn what was removed on the device, and sends it again";
        case OptionalService::TransactionLog:
            return "the steps of installs are kept nowhere";
        case OptionalService::Notifications:
            return "the home screen is not told that a sync begins and ends";
        case OptionalService::NotificationCenter:
            return "coordinators that the client has not touched itself are not observed";
        case OptionalService::CancelByPerson:
            return "only the plug-in itself gives up an install";
    }
    return "?";
}

}  // namespace appsync
