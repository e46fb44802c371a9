// Client description: the facts about this appliance that it tells its server.
//
// Each function reads one fact afresh from the platform and stays silent on failure; the builder
// that knows what the failure means logs it.

#ifndef ZELO_QRM_CLIENT_DESCRIPTION_H
#define ZELO_QRM_CLIENT_DESCRIPTION_H

#include <json/value.h>

#include <string>

namespace client_description {

// The host name; false when it cannot be read or is empty.
bool ReadHostName(std::string &strHostName);

// The model name ("upnpmodelname" of "/etc.defaults/zeloinfo.conf"); false when it is not there.
bool ReadModel(std::string &strModel);

// Sets "build_number" (integer) and "nvo_version" (text such as "NVO 6.2-123 Update 4") from
// "/etc.defaults/VERSION". False, with the description unchanged, when "majorversion",
// "minorversion" or "buildnumber" is not there.
bool ReadVersion(Json::Value &description);

// The port of the appliance's web interface over HTTP ("admin_port" of "/etc/zeloinfo.conf") and
// over HTTPS ("secure_admin_port"); false when the key is not there.
bool ReadAdminPort(long &port);
bool ReadSecureAdminPort(long &port);

// Whether the web interface is served over HTTPS ("runHTTPS" of "/etc/zeloinfo.conf" is "yes").
bool IsHttpsServed();

// The serial number: the custom one, or, when that cannot be read or is empty, the one in flash.
// strSerial is set in any case, to the empty text when neither can be read. False, with the
// platform's last error set, when the one in flash was asked for and could not be read.
bool ReadSerialNumber(std::string &strSerial);

}  // namespace client_description

#endif
