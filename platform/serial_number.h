// Serial numbers: what tells this appliance from every other one.
//
// An appliance carries one serial number from the factory, in its flash memory. A vendor or a
// service technician may give it a custom one besides, which then takes precedence; a caller asks
// for the custom number first and falls back to the one in flash.
//
// Both operations read afresh in each call; any thread may call them at any time.

#ifndef ZELO_PLATFORM_SERIAL_NUMBER_H
#define ZELO_PLATFORM_SERIAL_NUMBER_H

#include "api.h"

extern "C" {

// Reads the custom serial number into szSerial, a buffer of cbSerial bytes, as zero-terminated text
// cut to fit.
//
// Returns a negative value when it cannot be read; the buffer is then left as it was. Returns 0 or
// more on success; an appliance without a custom serial number succeeds with the empty text.
ZELO_PLATFORM_API int YLIBGetCustomSerialNumber(char *szSerial, int cbSerial);

// Reads the serial number in flash into szSerial, a buffer of cbSerial bytes, as zero-terminated
// text cut to fit.
//
// Returns a negative value when it cannot be read (no flash, or nothing stored there); the buffer
// is then left as it was. Returns 0 or more on success.
ZELO_PLATFORM_API int YLIBGetSerialNumber(char *szSerial, int cbSerial);
}

#endif
