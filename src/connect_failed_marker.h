// The marker of a connection that failed, "/tmp/qrmclientconnectfailed": its time says when the
// user was told last. All processes of the appliance share it, in a folder that is everybody's.

#ifndef ZELO_CONNECT_FAILED_MARKER_H
#define ZELO_CONNECT_FAILED_MARKER_H

namespace connect_failed_marker {

// Whether the user was told within the last two hours. A clock that was set back does not silence
// it for longer, and somebody else's file not at all.
bool IsRecent();

// Sets the marker's time to now, and makes one where there is none.
void Touch();

// Removes the marker; none is no error.
void Remove();

}  // namespace connect_failed_marker

#endif
