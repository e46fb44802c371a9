// Membership as the enrolling program sees it: what the library leaves to its caller when joining,
// and what is left to do after the library's leave.

#ifndef QRMCTL_MEMBERSHIP_H
#define QRMCTL_MEMBERSHIP_H

#include <csignal>
#include <string>
#include <vector>

#include "appliance.h"

namespace qrmctl {

using appliance::kCacheDaemon;
using appliance::kConfigFile;
using appliance::kJoinFlag;
using appliance::kNotificationCenter;
using appliance::kQrmServer;
using appliance::kServiceAccount;
using appliance::kSessionIndex;
constexpr const char *kClientSessions[] = {appliance::kClientSession, appliance::kMachineSession};

// The steps of a join behind the library's own, each of which returns whether it succeeded. They
// are taken in this order, the join flag last: "yes" is only ever written over a complete state.

// Stores the serial number with the credential that is in force: plug-ins are told it at a leave.
bool StoreSerial(const std::string &strSerial);

// Stores the session with the access token under the id of the credential that is in force.
bool StoreServerSession(const std::string &strToken);

// Stores the notification center's credential, for the same server and with a session of its own.
bool StoreNotificationCenter(const std::string &strToken);

bool StartCacheDaemon();
bool AddClientSessions();

// Seeds the generator that the account's password comes from, and creates the account.
bool CreateServiceAccount();

bool SetJoinFlag(const char *szValue);

// What the time counts for while a turn is waited for.
constexpr const char *kTurnStage = "waiting for another program that joins or leaves";

// A turn at changing the membership: other programs that take one wait, and a signal that would end
// this one is put off until the change is whole.
class MembershipTurn {
  public:
    MembershipTurn();
    ~MembershipTurn();
    MembershipTurn(const MembershipTurn &) = delete;
    MembershipTurn &operator=(const MembershipTurn &) = delete;

    // False when another program has kept its turn for too long.
    bool IsTaken() const { return m_handle >= 0; }

  private:
    int m_handle = -1;
    sigset_t m_before = {};
};

// Whether the credential store can be read. A store that cannot looks like an empty one to the
// look-ups, and nothing in it could be removed.
bool IsStoreReadable();

// Where damaged credential stores were set aside, now and earlier.
std::vector<std::string> StoresSetAside();

struct LeaveRequest {
    bool blRejoin = false;
    std::string strFrom;
    bool blClearGluster = false;
};

// Leaves until nothing is left, from any half-way state: the library's leave as often as it takes,
// then what it does not look for. Returns false when a step failed, and when it is not certain that
// nothing is left.
bool LeaveWholly(const LeaveRequest &request);

}  // namespace qrmctl

#endif
