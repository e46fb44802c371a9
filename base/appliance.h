// The appliance's names that more than one room knows: applications, files, keys, the service
// account, web sessions.

#ifndef ZELO_APPLIANCE_H
#define ZELO_APPLIANCE_H

namespace appliance {

// Applications, by which programs find a credential.
constexpr const char *kQrmServer = "ZELO.QRM";
constexpr const char *kNotificationCenter = "ZELO.NotificationCenter";
constexpr int kCredentialOwner = 1024;

// The server's Web API for joining, and the path under which a server tells where an API is.
constexpr const char *kQrmApi = "ZELO.QRM.RPC";
constexpr const char *kDiscoveryPath = "/qrm/discover";

// Web sessions with which the server reaches this appliance.
constexpr int kSessionIndex = 13;
constexpr const char *kClientSession = "ZELO.QRM.Client";
constexpr const char *kMachineSession = "ZELO.QRM.Client.Machine";

// The local administrator that the server uses.
constexpr const char *kServiceAccount = "ZelonixQRM";
constexpr const char *kAdministrators = "administrators";
constexpr const char *kAccountFolder = "/usr/zelo/etc/QRM";

constexpr const char *kConfigFile = "/etc/zeloinfo.conf";
constexpr const char *kDefaultsFile = "/etc.defaults/zeloinfo.conf";
constexpr const char *kVersionFile = "/etc.defaults/VERSION";
constexpr const char *kClientInfoFile = "/tmp/qrm_client.info";
constexpr const char *kCacheDaemon = "/usr/zelo/etc/rc.d/S99zelocache.sh";

// The key of kConfigFile that says whether the appliance is joined: "yes" or not.
constexpr const char *kJoinFlag = "join_nvo_qrm";

// The variable of a notification's text that names the server.
constexpr const char *kServerVariable = "%QRM_SERVER%";

}  // namespace appliance

#endif
