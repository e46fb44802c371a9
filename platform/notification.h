// Notifications: telling the appliance's own users that something has happened.
//
// A notification has a tag, which names the event, and variables. Title and text of a tag come from
// the interface strings; each variable's name in them gives way to its value.

#ifndef ZELO_PLATFORM_NOTIFICATION_H
#define ZELO_PLATFORM_NOTIFICATION_H

#include "api.h"
#include "text_containers.h"

extern "C" {

// Sends the notification of the tag szTag. ppHash designates the variables: names such as
// "%QRM_SERVER%" with their values; null, or a null hash, stands for none. The hash stays the
// caller's and is not changed.
//
// Returns 0 when the notification stands where the appliance's users find it. Returns a negative
// value, with the last error set (last_error.h), when it does not: YLIBC_ERR_FILE when it could not
// be written there, for want of space or rights, YLIBC_ERR_UNSAFE_FILE when a link, another user's
// file or something that is no file stands there, YLIBC_ERR_BUSY when another program held the
// place for too long. Programs that pass notifications on are told in each of these cases; what
// they make of it does not count. Any thread may call it at any time.
//
// (The operation's name is spelt like this on every platform.)
ZELO_PLATFORM_API int ZELOSysNotifySendNotifiction(const char *szTag, YLIBSZHASH **ppHash);
}

#endif
