#include "command_texts.h"

#include "report.h"

namespace qrmctl {
namespace {

struct Text {
    const char *szCommand;
    const char *szText;
    const char *szExamples;
};

constexpr Text kTexts[] = {
    {"test-connection",
     "The candidates are tried in their order, each over HTTPS first; the first one that answers "
     "for the Web API is shown. The file holds a JSON array of objects with \"host\", "
     "\"https_port\" and \"http_port\"; a port of 0 is not tried.",
     "qrmctl test-connection --api ZELO.QRM.RPC candidates.json"},
    {"join",
     "All steps of a membership are taken, the join flag last; when one fails, those before it are "
     "undone. What is left of an earlier membership goes once a server has answered. An appliance "
     "that is joined already stays as it is without --again; with it the old membership ends "
     "before "
     "the server accepts the new one. The token goes over plain HTTP only "
     "with --allow-http. Once a server has answered, Ctrl-C and SIGTERM wait until the join is "
     "done "
     "or undone, thus for the server's answer too; --deadline ends it sooner.",
     "qrmctl join --server qrm.example --http-port 0 --https-port 5001 \\\n"
     "    --token-file token"},
    {"status",
     "Six indicators have to agree: the join flag, the credentials of the server and of the "
     "notification center, the cache daemon, the web sessions and the service account. The "
     "judgement is shown, and is the exit status too.",
     "qrmctl status --explain"},
    {"leave",
     "Removes what joining left behind, also from a half-way state. The server is not told. When a "
     "step fails, what came before it is done: leave again when its cause is mended.",
     "qrmctl leave"},
    {"credential",
     "The credential tells where the server is, its session holds the tokens. Of several that are "
     "stored the first one is in force.",
     "qrmctl credential show\n"
     "qrmctl credential show --with-token --json"},
    {"call",
     "The whole reply is shown. A reply that tells of a failure ends the command with exit status "
     "1, after it has been shown.",
     "qrmctl call ZELO.QRM.RPC info\n"
     "qrmctl call ZELO.QRM.RPC.Log push --params @entry.json"},
    {"get-file",
     "The file arrives beside PATH and is renamed when it is whole, so PATH is the old file or the "
     "new one. When the server says that the copy at PATH is current, it stays.",
     "qrmctl get-file update.bin ZELO.QRM.RPC.File get \\\n"
     "    --params '{\"name\": \"update\", \"size\": 100000}'"},
    {"log",
     "The message is sent in every language of the interface, its markers {0}, {1} and so on "
     "filled with the parameters. A parameter may name an interface text, as {section:key}. "
     "A warning says what does not fit into the 4095 bytes of a message.",
     "qrmctl log warning - 'Disk {0} is warm' 3\n"
     "qrmctl log --render info common ok"},
    {"info",
     "The file is shared by all programs and empty after a restart. The library writes its key "
     "'status': how the latest call that got an answer went.",
     "qrmctl info get status"},
    {"notify", "The variable QRM_SERVER is set by itself, to the stored server's host.",
     "qrmctl notify QRMClientConnectFailed"},
    {"account",
     "The account is the local administrator ZelonixQRM, with which the server manages this "
     "appliance.",
     "qrmctl account create"},
    {"plugins", "For authors of plug-ins: runs them as a leave would, and changes nothing else.",
     "qrmctl plugins run disjoin PRE -v"},
    {"idle",
     "The time is that after which the disks sleep. A program that has read it in order to change "
     "it records that, and later readers get the time that it read while it lives.",
     "qrmctl idle set 20"},
    {"update",
     "The server gets the appliance's name, model, version and ports as they are now. The entry is "
     "found by the serial number that the join has stored.",
     "qrmctl update --host 192.0.2.7"},
    {"welcome", "The welcome pages are what a user sees at the first login to this appliance.",
     "qrmctl welcome hide admin"},
    {"doctor",
     "Each way is taken step by step, from the name to the Web API, and each step says what was "
     "seen and what mends it. What is stored of the membership is checked too. Without options the "
     "stored server is looked at.",
     "qrmctl doctor\n"
     "qrmctl doctor --server qrm.example --http-port 0 --https-port 5001"},
    {"support",
     "The archive holds the judgement, what doctor finds, versions, settings and how the client's "
     "files lie, as a tar file with gzip. Tokens and passwords are left out; host names, addresses "
     "and the serial number are not.",
     "qrmctl support support.tar.gz"},
};

}  // namespace

void AddTexts(command::CommandHandle program) {
    for (const Text &text : kTexts) {
        program.Command(text.szCommand).Explain(text.szText, text.szExamples);
    }
}

const std::vector<option_table::ExitStatus> &ExitStatuses() {
    static const std::vector<option_table::ExitStatus> statuses = {
        {kDone, nullptr, "Done."},
        {kDone, "qrmctl status", "This appliance is joined."},
        {kFailed, nullptr, "The operation failed; standard error says why and what to do."},
        {kUsage, nullptr, "Wrong usage; standard error says which word."},
        {kNotJoined, "qrmctl status", "This appliance is not joined."},
        {kInconsistent, "qrmctl status", "This appliance is half joined: the indicators disagree."},
        {kDeadline, nullptr,
         "The deadline struck; standard error says what the time was spent on."},
        {kDeadline, "qrmctl status",
         "The deadline struck, after 10 seconds without --deadline; standard error says what the "
         "time was spent on."},
    };
    return statuses;
}

}  // namespace qrmctl
