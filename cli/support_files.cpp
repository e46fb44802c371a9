#include "support_files.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <json/version.h>
#include <openssl/crypto.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <filesystem>

#include "clock_check.h"
#include "deadline.h"
#include "descriptor.h"
#include "diagnosis.h"
#include "fixed_text.h"
#include "key_value_file.h"
#include "membership.h"
#include "platform_handles.h"
#include "redaction.h"
#include "report.h"
#include "words.h"

namespace qrmctl {
namespace {

namespace fs = std::filesystem;

constexpr off_t kMaxTail = off_t{1024} * 1024;
constexpr std::size_t kNotifications = 50;
constexpr std::size_t kLogLines = 200;
constexpr int kMaxListed = 500;
// All four runs together end before support's own deadline.
constexpr double kStatusLimit_s = 10;
constexpr double kDoctorLimit_s = 60;

// --- Reading ------------------------------------------------------------------------------------

// The end of a regular file; empty when there is none. Nothing is followed or waited for: a name in
// "/tmp" may be a trap.
std::string Tail(const char *szPath) {
    const int fd = open(szPath, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
    struct stat status = {};
    std::string strText;
    if (fd >= 0 && fstat(fd, &status) == 0 && S_ISREG(status.st_mode)) {
        const off_t begin = std::max(off_t{0}, status.st_size - kMaxTail);
        strText.resize(static_cast<std::size_t>(status.st_size - begin));
        const ssize_t cb = pread(fd, strText.data(), strText.size(), begin);
        strText.resize(cb < 0 ? 0 : static_cast<std::size_t>(cb));
    }
    if (fd >= 0) {
        close(fd);
    }
    return strText;
}

std::string LastLines(const std::string &strText, std::size_t count,
                      bool (*pfnKeep)(const std::string &)) {
    std::vector<std::string> lines;
    for (const std::string &strLine : words::Split(strText, '\n')) {
        if (pfnKeep == nullptr || pfnKeep(strLine)) {
            lines.push_back(strLine);
        }
    }
    std::string strLast;
    for (std::size_t i = lines.size() - std::min(count, lines.size()); i < lines.size(); ++i) {
        strLast += lines[i] + '\n';
    }
    return strLast;
}

// A file without a name.
class NamelessFile {
  public:
    int Get() const { return m_file.Get(); }
    std::string Text() const {
        struct stat status = {};
        std::string strText;
        if (fstat(Get(), &status) == 0) {
            strText.resize(static_cast<std::size_t>(status.st_size));
            const ssize_t cb = pread(Get(), strText.data(), strText.size(), 0);
            strText.resize(cb < 0 ? 0 : static_cast<std::size_t>(cb));
        }
        return strText;
    }

  private:
    const Descriptor m_file{memfd_create("output", MFD_CLOEXEC)};
};

// Runs this very program with these arguments; returns its exit status, -1 when it cannot be run.
int RunAgain(std::vector<std::string> words, const NamelessFile &out, const NamelessFile &err) {
    words.insert(words.begin(), "qrmctl");
    std::vector<char *> arguments;
    arguments.reserve(words.size() + 1);
    for (std::string &strWord : words) {
        arguments.push_back(strWord.data());
    }
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, out.Get(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, err.Get(), STDERR_FILENO);
    pid_t pid = -1;
    const int result =
        posix_spawn(&pid, "/proc/self/exe", &actions, nullptr, arguments.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    int status = 0;
    while (result == 0 && waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR) {
            return -1;
        }
    }
    return result == 0 && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// What a command prints, as if it had been typed. A process of its own has a deadline of its own,
// which comes no later than this program's.
std::string OutputOf(std::vector<std::string> words, bool blJson, double limit_s) {
    constexpr double kLeast_s = 0.01;
    // Nothing is begun that would outlast the deadline.
    if (IsDeadlineOver()) {
        return "It was not run: the deadline was over.\n";
    }
    Report::Stage("running qrmctl " + words.front());
    const double deadline_s = std::max(kLeast_s, std::min(limit_s, DeadlineLeft_s()));
    words.insert(words.end(), {"--deadline", std::to_string(deadline_s)});
    if (blJson) {
        words.emplace_back("--json");
    }
    const NamelessFile out;
    const NamelessFile err;
    const int status = RunAgain(words, out, err);
    return blJson ? out.Text()
                  : out.Text() + err.Text() + "exit status: " + std::to_string(status) + '\n';
}

// --- Texts --------------------------------------------------------------------------------------

// The version of a library that came with the platform's, by the function that tells it.
std::string PlatformVersion(const char *szFunction) {
    const auto pfnVersion = reinterpret_cast<const char *(*)()>(dlsym(RTLD_DEFAULT, szFunction));
    return pfnVersion != nullptr ? pfnVersion() : "not loaded";
}

std::string Versions() {
    utsname kernel = {};
    uname(&kernel);
    FixedText<256> system;
    for (const char *szFile : {"/usr/lib/os-release", "/etc/os-release"}) {
        if (system.Empty()) {
            YLIBCFileGetKeyValue(szFile, "PRETTY_NAME", system.Buffer(), FixedText<256>::Size(), 0);
        }
    }
    return std::string("libzeloqrmclient, qrmctl: ") + ZELO_VERSION +
           "\nsystem: " + (system.Empty() ? "unknown" : system.sz()) +
           "\nkernel: " + kernel.sysname + ' ' + kernel.release + ' ' + kernel.machine +
           "\nlibcurl: " + PlatformVersion("curl_version") +
           "\nOpenSSL: " + OpenSSL_version(OPENSSL_VERSION) +
           "\nSQLite: " + PlatformVersion("sqlite3_libversion") +
           "\nJsonCpp: " + JSONCPP_VERSION_STRING + "\ncollected: " + TimeText(std::time(nullptr)) +
           '\n';
}

struct Setting {
    const char *szFile;
    const char *szKey;
};

// What the library and the platform look up; nothing else of the files is anybody's business.
constexpr std::array<Setting, 17> kSettings = {{
    {kConfigFile, "join_nvo_qrm"},
    {kConfigFile, "admin_port"},
    {kConfigFile, "secure_admin_port"},
    {kConfigFile, "runHTTPS"},
    {kConfigFile, "language"},
    {kConfigFile, "farlink_relay"},
    {kConfigFile, "use_proxy_environment"},
    {kConfigFile, "exec_timeout"},
    {kConfigFile, "plugin_timeout"},
    {kConfigFile, "max_users"},
    {kConfigFile, "extra_admin_QRM"},
    {kConfigFile, "disk_idle_minutes"},
    {"/etc.defaults/zeloinfo.conf", "upnpmodelname"},
    {"/etc.defaults/VERSION", "majorversion"},
    {"/etc.defaults/VERSION", "minorversion"},
    {"/etc.defaults/VERSION", "buildnumber"},
    {"/etc.defaults/VERSION", "smallfixnumber"},
}};

std::string Configuration() {
    std::string strAll;
    for (const Setting &setting : kSettings) {
        FixedText<1024> value;
        const int cb = YLIBCFileGetKeyValue(setting.szFile, setting.szKey, value.Buffer(),
                                            FixedText<1024>::Size(), 0);
        // What stands before an "@" in the relay's address authenticates there.
        std::string strValue = value.sz();
        const std::size_t sign = strValue.rfind('@');
        if (sign != std::string::npos) {
            strValue.replace(0, sign, kRedacted);
        }
        strAll += std::string(setting.szFile) + ": " + setting.szKey + '=' +
                  (cb < 0    ? "(the file cannot be read)"
                   : cb == 0 ? "(not set)"
                             : '"' + strValue + '"') +
                  '\n';
    }
    return strAll;
}

std::string ClientInfo() {
    constexpr int kHashSize = 512;
    HashHandle hash(YLIBCSzHashAlloc(kHashSize));
    if (YLIBCFileGetPair("/tmp/qrm_client.info", hash.Address()) < 0) {
        return "There is no client info file, or it cannot be read.\n";
    }
    std::string strAll;
    for (int i = 0; YLIBCSzHashKeyAt(hash.Get(), i) != nullptr; ++i) {
        strAll += std::string(YLIBCSzHashKeyAt(hash.Get(), i)) + "=\"" +
                  YLIBCSzHashValueAt(hash.Get(), i) + "\"\n";
    }
    return strAll;
}

bool IsOurLine(const std::string &strLine) {
    // The tools, the library, and the host platform's sources.
    constexpr std::array<const char *, 9> kParts = {
        "qrm",          "zelo",           "discovery",       "http_exchange", "damaged_store",
        "notification", "program_folder", "sqlite_database", "store_file"};
    return std::any_of(kParts.begin(), kParts.end(), [&](const char *szPart) {
        return strLine.find(szPart) != std::string::npos;
    });
}

std::string LogLines() {
    std::string strAll;
    for (const char *szLog : {"/var/log/messages", "/var/log/syslog"}) {
        strAll += LastLines(Tail(szLog), kLogLines, IsOurLine);
    }
    return strAll.empty() ? "Neither /var/log/messages nor /var/log/syslog has a line of ours.\n"
                          : strAll;
}

// One line such as "-rw------- 0:0 8192 2030-05-14T09:26:53Z /path".
void ListOne(const fs::path &path, std::string &strAll) {
    struct stat status = {};
    if (lstat(path.c_str(), &status) != 0) {
        strAll += "(none) " + path.string() + '\n';
        return;
    }
    constexpr const char *kRights = "rwxrwxrwx";
    std::string strMode(1, S_ISDIR(status.st_mode)   ? 'd'
                           : S_ISLNK(status.st_mode) ? 'l'
                           : S_ISREG(status.st_mode) ? '-'
                                                     : '?');
    for (unsigned int i = 0; i < 9; ++i) {
        strMode += (status.st_mode & (0400U >> i)) != 0 ? kRights[i] : '-';
    }
    std::error_code ignored;
    strAll +=
        strMode + ' ' + std::to_string(status.st_uid) + ':' + std::to_string(status.st_gid) + ' ' +
        std::to_string(status.st_size) + ' ' + TimeText(status.st_mtime) + ' ' + path.string() +
        (S_ISLNK(status.st_mode) ? " -> " + fs::read_symlink(path, ignored).string() : "") + '\n';
}

std::string Files() {
    constexpr std::array<const char *, 21> kPaths = {"/usr/zelo/etc/credentials",
                                                     "/usr/zelo/etc/sessions",
                                                     "/usr/zelo/etc/ssl/ca.d",
                                                     "/usr/zelo/etc/plugins",
                                                     "/usr/zelo/etc/notify.d",
                                                     "/usr/zelo/etc/rc.d",
                                                     "/usr/zelo/etc/service.d",
                                                     "/usr/zelo/etc/QRM",
                                                     "/etc/zeloinfo.conf",
                                                     "/etc/.zeloinfo.conf.lock",
                                                     "/etc.defaults",
                                                     "/tmp/qrm_client.info",
                                                     "/tmp/qrm_client.info.lock",
                                                     "/tmp/qrmclientconnectfailed",
                                                     "/var/run/qrmctl.membership.lock",
                                                     "/tmp/qrm_idle_time",
                                                     "/tmp/qrm_idle_time.lock",
                                                     "/tmp/userlock",
                                                     "/var/run/zelocache.pid",
                                                     "/var/log/notifications.jsonl",
                                                     "/var/log/notifications.jsonl.1"};
    std::string strAll;
    int count = 0;
    for (const char *szPath : kPaths) {
        ListOne(szPath, strAll);
        std::error_code error;
        for (fs::recursive_directory_iterator entry(szPath, error), end;
             !error && entry != end && count < kMaxListed; entry.increment(error), ++count) {
            ListOne(entry->path(), strAll);
        }
    }
    return strAll + (count < kMaxListed ? "" : "(and more)\n");
}

constexpr const char *kReadme =
    "What qrmctl support collected on an appliance that is a client of a QRM server.\n"
    "\n"
    "versions.txt         the library, the system and the libraries below\n"
    "status.txt, .json    qrmctl status --explain\n"
    "doctor.txt, .json    qrmctl doctor, with the stored connection\n"
    "configuration.txt    the settings that the client and its platform look up\n"
    "client_info.txt      the client info file\n"
    "notifications.jsonl  the last 50 notifications\n"
    "log.txt              the last lines of the system's log that concern the client\n"
    "files.txt            mode, owner, size and time of the client's files\n"
    "\n"
    "Every access and csrf token of the credential store was searched for in all of them, plain,\n"
    "escaped, in hexadecimal and in Base64, and replaced by [redacted]. Tokens of fewer than 4\n"
    "bytes were not searched for. In texts of other programs (client info, notifications, log),\n"
    "[redacted] also stands for what follows \"Bearer\" or a name such as token, password,\n"
    "passphrase, pwd, secret, key, cred, cookie, auth or sid, for passwords in URLs, and for "
    "every\n"
    "word of 16 or more characters that mixes digits, small and capital letters: it may be a "
    "token\n"
    "of an earlier membership, which nobody knows any more. Host names, addresses and the serial\n"
    "number are still there: look the files through before you pass them on.\n";

constexpr const char *kUnreadable =
    "Left out: the credential store cannot be read, so it is not known what would have to be\n"
    "redacted here.\n";
constexpr const char *kSetAside =
    "Left out: a damaged credential store was set aside, and its tokens cannot be searched for.\n"
    "Remove the files named credentials.db.damaged-... when nobody needs them any more.\n";

// Why texts of others cannot be redacted; empty when they can.
std::string WhyLeftOut(bool blKnown) {
    constexpr int kListSize = 16;
    ListHandle list(YLIBCSzListAlloc(kListSize));
    int count = list.Get() == nullptr ? -1 : 0;
    // A platform may set nothing aside.
    if (count == 0 && ZELOCredStoreListSetAside != nullptr) {
        count = ZELOCredStoreListSetAside(list.Address());
    }
    if (!blKnown || count < 0) {
        return kUnreadable;
    }
    return count > 0 ? kSetAside : "";
}

// A password of the configuration may turn up elsewhere.
void AddConfigured(Redaction &redaction) {
    constexpr int kHashSize = 4096;
    HashHandle hash(YLIBCSzHashAlloc(kHashSize));
    static_cast<void>(YLIBCFileGetPair(kConfigFile, hash.Address()));
    for (int i = 0; YLIBCSzHashKeyAt(hash.Get(), i) != nullptr; ++i) {
        if (IsSecretName(YLIBCSzHashKeyAt(hash.Get(), i))) {
            redaction.Add(YLIBCSzHashValueAt(hash.Get(), i));
        }
    }
}

}  // namespace

std::vector<SupportFile> CollectSupportFiles() {
    Redaction redaction;
    const bool blKnown = redaction.AddStored();
    AddConfigured(redaction);
    const std::string strWhy = WhyLeftOut(blKnown);
    // By value first: what masking leaves of a token would not be found.
    const auto ofOthers = [&](const std::string &strText) {
        return strWhy.empty() ? MaskNamed(redaction.Redact(strText)) : strWhy;
    };
    const std::string strMissing =
        strWhy.empty() ? "" : "\nclient_info.txt, notifications.jsonl and log.txt: " + strWhy;
    std::vector<SupportFile> files = {
        {"README.txt", kReadme + strMissing},
        {"versions.txt", Versions()},
        {"status.txt", OutputOf({"status", "--explain"}, false, kStatusLimit_s)},
        {"status.json", OutputOf({"status", "--explain"}, true, kStatusLimit_s)},
        {"doctor.txt", OutputOf({"doctor"}, false, kDoctorLimit_s)},
        {"doctor.json", OutputOf({"doctor"}, true, kDoctorLimit_s)},
        {"configuration.txt", Configuration()},
        {"client_info.txt", ofOthers(ClientInfo())},
        {"notifications.jsonl",
         ofOthers(LastLines(Tail("/var/log/notifications.jsonl"), kNotifications, nullptr))},
        {"log.txt", ofOthers(LogLines())},
        {"files.txt", Files()}};
    for (SupportFile &file : files) {
        file.strText = redaction.Redact(file.strText);
    }
    return files;
}

}  // namespace qrmctl
