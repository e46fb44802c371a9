// Plug-in SDK: programs of other packages that run around a change of the appliance.
//
// A plug-in is known by a name such as "qrm_client/disjoin". Packages put programs into it; whoever
// makes the change initialises the plug-in, sets arguments and runs an action of it, which runs all
// of its programs one after the other. The family, such as "qrm_client", says who makes the change:
// it tells the arguments of different callers apart. docs/plug-ins.md is for those who write
// programs.
//
// A handle belongs to one thread at a time; different handles may be used in different threads at
// once. Results: negative on failure, with the last error set (last_error.h).

#ifndef ZELO_PLATFORM_PLUGIN_SDK_H
#define ZELO_PLATFORM_PLUGIN_SDK_H

#include "api.h"

// The numbers are fixed. Those that are not named stand for actions that a port may have besides.
enum _tag_sdk_plugin_action_ : int {
    SDK_PLUGIN_ACTION_PRE = 4,  // before the change
    SDK_PLUGIN_ACTION_POST = 5  // after it, whether it succeeded or not
};

struct YLIBPLUGIN;  // opaque; each port lays it out as it likes

extern "C" {

// Initialises the plug-in szPlugin for the family szFamily: *ppHandle then designates a new handle,
// which the caller owns and releases with YLIBPluginExit. A plug-in that no package has put
// anything into succeeds; its actions have nothing to run.
//
// Returns 0 or more on success. Returns a negative value, with *ppHandle null, when the plug-in
// cannot be used, or (YLIBC_ERR_INVALID_ARGUMENT) when a name is unusable: a family is lower-case
// letters, digits and underscores, beginning with a letter; a plug-in's name is parts with a slash
// between them, none of which is empty, "." or "..".
ZELO_PLATFORM_API int YLIBPluginSDKInit(const char *szFamily, const char *szPlugin,
                                        YLIBPLUGIN **ppHandle);

// Whether the handle is one of an initialised plug-in: non-zero when it is, 0 when it is null.
ZELO_PLATFORM_API int YLIBPluginHasInit(const YLIBPLUGIN *pHandle);

// Sets an argument, for all actions that follow, to an integer or to a copy of a text; one that was
// set before gets the new value. A name is letters, digits and underscores, and not empty.
//
// Returns 0 or more on success, a negative value with the argument as it was otherwise.
ZELO_PLATFORM_API int YLIBPluginSetArgByInt(YLIBPLUGIN *pHandle, const char *szName, int value);
ZELO_PLATFORM_API int YLIBPluginSetArg(YLIBPLUGIN *pHandle, const char *szName,
                                       const char *szValue);

// Runs all programs of the plug-in for the action, in the order of their names and in the caller's
// thread, and waits for each. A program that fails does not keep the others from running. One that
// runs for longer than the platform's limit is ended, and has failed. Programs that others than
// root and the caller could have changed are passed over.
//
// Returns 0 when no program failed; otherwise the first failing program's status as a negative
// number, which also is what a caller gets (-1) when the programs could not be found out or the
// arguments are unusable.
ZELO_PLATFORM_API int YLIBPluginAction(_tag_sdk_plugin_action_ action, YLIBPLUGIN *pHandle);

// Releases the handle; null, as a failed initialisation leaves it, is no error. Returns 0.
ZELO_PLATFORM_API int YLIBPluginExit(YLIBPLUGIN *pHandle);
}

#endif
