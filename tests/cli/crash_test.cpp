// qrmctl join and leave, killed before every platform call in turn: whatever is left behind, one
// leave clears it away.

#include <iostream>

#include "commands.h"
#include "joined.h"
#include "membership_state.h"
#include "zeloqrmclient.h"

namespace {

using namespace files;
using Arguments = std::vector<std::string>;

constexpr int kKilled = -SIGKILL;
constexpr const char *kTokenFile = "/tmp/token";

class Crash : public joined::Joined {
  protected:
    void SetUp() override {
        std::ofstream(kTokenFile) << joined::kToken;
        s_without = accounts::ReadFiles();
        membership::Clear(s_without);
    }
    void TearDown() override { membership::Clear(s_without); }

    // Runs a command of qrmctl in a process of its own, which dies before the call with that
    // number; 0 lets it live. Returns the exit status, or the signal's number below zero.
    static int Run(const Arguments &arguments, int killAt = 0) {
        std::fflush(nullptr);
        const pid_t pid = fork();
        if (pid == 0) {
            command::Program program("qrmctl", "", "");
            qrmctl::Action action;
            qrmctl::AddJoin(program.Root(), action);
            qrmctl::AddLeave(program.Root(), action);
            if (program.Read(arguments)) {
                _exit(qrmctl::kUsage);
            }
            const std::ostringstream quiet;
            std::cout.rdbuf(quiet.rdbuf());
            qrmctl::Report report(false);
            seam::Fault fault;
            fault.killAt = killAt;
            int status = qrmctl::kFailed;
            seam::Observe(fault, [&] { status = action(report); });
            _exit(status);
        }
        int status = -1;
        waitpid(pid, &status, 0);
        return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }

    // Kills the command before its first call, its second one, and so on until it has no more;
    // returns how many there were.
    static int KillAtEveryCall(const Arguments &command, const std::function<void()> &setUp) {
        for (int killAt = 1;; ++killAt) {
            SCOPED_TRACE("killed at call " + std::to_string(killAt));
            setUp();
            const int status = Run(command, killAt);
            if (status != kKilled) {
                EXPECT_EQ(status, 0) << "what is not killed succeeds";
                return killAt - 1;
            }
            EXPECT_EQ(Run({"leave"}), 0);
            EXPECT_EQ(Left(), "");
        }
    }

    // All that a membership may leave behind, also what nobody looks at.
    static std::string Left() {
        std::string strAll = membership::Remains() + accounts::Findings();
        strAll += ZELOQRMClientStatus() == 0 ? "" : " status";
        for (const char *szPath : {membership::kPreference, "/var/services/homes/ZelonixQRM",
                                   "/var/run/zelocache.pid"}) {
            strAll += fs::exists(szPath) ? ' ' + std::string(szPath) : "";
        }
        for (long id = 0; id < 10; ++id) {
            const stored::Session pSess(ZELOCredSessAlloc(), ZELOCredSessFree);
            strAll += ZELOCredSessLoad(id, pSess.get()) < 0 ? "" : " session";
        }
        return strAll;
    }

    inline static accounts::Files s_without;
};

TEST_F(Crash, OneLeaveClearsAwayAJoinThatWasKilledAnywhere) {
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    const Arguments join = {"join",         "--server", "localhost",    "--http-port", "0",
                            "--https-port", strPort,    "--token-file", kTokenFile};
    // With a store of its own each time, the ids of what is left over stay within those looked at.
    const int calls = KillAtEveryCall(join, [] { fs::remove_all(stored::kFolder); });
    EXPECT_EQ(membership::Remains(), membership::kJoined);
    EXPECT_EQ(ZELOQRMClientStatus(), 1);
    EXPECT_GT(calls, 100);
    std::cout << "join: killed at each of " << calls << " calls\n";
}

// The start is one that takes a leave more than once: joined twice, with rights.
TEST_F(Crash, OneLeaveEndsWhatAKilledOneBegan) {
    ASSERT_TRUE(ZELOQRMClientCreateServerUser());
    const accounts::Files files = accounts::ReadFiles();
    const int calls = KillAtEveryCall({"leave"}, [&] {
        membership::Build(files);
        stored::AddSession(stored::AddCredential("ZELO.QRM", "second"), "t");
    });
    EXPECT_EQ(Left(), "");
    EXPECT_GT(calls, 50);
    std::cout << "leave: killed at each of " << calls << " calls\n";
}

TEST_F(Crash, OneLeaveClearsAwayWhatTheStatusDoesNotLookAt) {
    ASSERT_TRUE(ZELOQRMClientCreateServerUser());
    YLIBGroupExtraAdminSet("QRM", 1, 2, 3, 4);
    YLIBCINFOSetKeyValue("join_nvo_qrm", "rejoin");
    EXPECT_EQ(ZELOQRMClientStatus(), 0);
    EXPECT_EQ(Run({"leave"}), 0);
    EXPECT_EQ(Left(), "");

    const std::string strConfig = FileText(kConfig);
    fs::remove(kConfig);
    stored::AddCredential("ZELO.QRM", "h");
    EXPECT_EQ(ZELOQRMClientStatus(), 0) << "nothing disagrees with a flag that cannot be read";
    EXPECT_EQ(Run({"leave"}), 0);
    EXPECT_EQ(Left(), "");
    std::ofstream(kConfig) << strConfig;
}

}  // namespace
