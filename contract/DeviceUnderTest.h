#pragma once

#include <string>
#include <vector>

#include "platform/Bytes.h"
#include "platform/DevicePolicyService.h"
#include "platform/Platform.h"

namespace appsync {

/// What a package or placeholder bundle says of itself.
struct BundleInfo {
    std::string identifier;
    std::string version = "1.0";
    std::string displayName = "Example";
};

/// One implementation of a device's services, and what the contract tests need to do beside them.
/// Made anew for each test: an empty device.
///
/// Whoever ports the plug-in writes one of these and hands it to the kit (contract/ContractKit.h).
class DeviceUnderTest {
  public:
    virtual ~DeviceUnderTest() = default;

    /// Lives as long as this object.
    virtual Platform services() = 0;

    /// Puts a package that can be installed on the device. Gives its device path.
    virtual std::string addPackage(const BundleInfo& info) = 0;

    /// Closes every service and opens it again on the same device, as the next process would find
    /// it; from then on `services()` gives the new ones. False where that is not offered.
    virtual bool reopen() { return false; }

    /// An icon layout of these applications, in the home screen's own form: an array of their
    /// identifiers, as a property list, where that is it.
    virtual Bytes iconState(const std::vector<std::string>& identifiers);

    // What a person or a manager does on the device: what the services need that the port has.

    /// Starts an application that is installed, which goes on running until `quit`. False when
    /// something keeps it from running.
    virtual bool run(const std::string& /*identifier*/) { return false; }
    virtual void quit(const std::string& /*identifier*/) {}
    /// Removes an application that is installed, and puts it on the installer's list.
    virtual void uninstallAsPerson(const std::string& /*identifier*/) {}
    /// Cancels the install that is under way for an application. False where nobody can.
    virtual bool cancelAsPerson(const std::string& /*identifier*/) { return false; }
    virtual void setPolicy(PolicyFeature /*feature*/, PolicyAnswer /*answer*/) {}
    virtual void addRestoreData(const std::string& /*identifier*/) {}
    /// From now on installs are to go through coordinators.
    virtual void turnCoordinationOn() {}

    /// The transaction log's scenarios: "scenario|identifier|yes|description", oldest first.
    virtual std::vector<std::string> scenarios() { return {}; }
};

}  // namespace appsync
