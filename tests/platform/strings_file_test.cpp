// Strings files: what a line means, and that no look-up is ever answered from a file's past.

#include "strings_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <atomic>
#include <ctime>
#include <thread>
#include <vector>

#include "children.h"
#include "failures.h"
#include "files.h"

namespace {

using namespace files;

constexpr const char *kFile = "/tmp/strings";

void Replace(const std::string &strText) {
    WriteFile("/tmp/strings.new", strText);
    fs::rename("/tmp/strings.new", kFile);
}

// The value, or "-" and the code of the failure.
std::string Get(const std::string &strSection, const std::string &strKey) {
    char sz[256] = "before";
    const int cb = YLIBCFileGetSectionValue(kFile, strSection.c_str(), strKey.c_str(), sz, 256);
    if (cb < 0) {
        return std::string(sz) == "before" ? "-" + std::to_string(YLIBCErrGet()) : "changed";
    }
    return static_cast<std::size_t>(cb) == std::string(sz).size() ? sz : "wrong length";
}

const std::string kNotFound = "-" + std::to_string(YLIBC_ERR_NOT_FOUND);

// Until the system tells the file's last change from a change made now, nothing is kept of it.
void AwaitAge() {
    const struct stat status = Status(kFile);
    timespec now = {};
    do {
        clock_gettime(CLOCK_REALTIME, &now);
    } while ((now.tv_sec - status.st_ctim.tv_sec) * 1000000000 + now.tv_nsec -
                 status.st_ctim.tv_nsec <
             100000000);
}

TEST(StringsFile, ReadsEveryFormOfALine) {
    Replace(
        "early=\"no section\"\n"
        "[one]\n"
        "plain=\"text\"\r\n"
        " \tspaced \t= \" a b \" \t\r\n"
        "escapes=\"a\\nb\\tc\\rd\\\"e\\\\f\\x\"\n"
        "utf8=\"Größe ≥ 1 [x]\"\n"
        "empty=\"\"\n"
        "bare=text\nopen=\"text\nescapedend=\"text\\\"\nmore=\"a\" b\ntwo=\"a\"b\"\n"
        "#plain=\"comment\"\n  # hidden=\"comment\"\n"
        "[two] tail\n"
        "after=\"no section\"\n"
        "  [two]\t\r\n"
        "plain=\"other\"\n"
        "=\"no key\"\n"
        "plain=\"too late\"\n"
        "[]\n"
        "key=\"nameless\"\n"
        "[one]\n"
        "plain=\"too late\"\n"
        "more=\"second section\"\n"
        "last=\"no line feed\"");
    const std::tuple<const char *, const char *, std::string> rows[] = {
        {"one", "plain", "text"},
        {"one", "spaced", " a b "},
        {"one", "utf8", "Größe ≥ 1 [x]"},
        {"one", "escapes", "a\nb\tc\rd\"e\\fx"},
        {"one", "empty", ""},
        {"two", "plain", "other"},
        {"", "key", "nameless"},
        {"one", "more", "second section"},
        {"one", "last", "no line feed"},
        {"one", "after", "no section"},
        {"one", "early", kNotFound},
        {"one", "bare", kNotFound},
        {"one", "open", kNotFound},
        {"one", "escapedend", kNotFound},
        {"one", "two", kNotFound},
        {"one", "hidden", kNotFound},
        {"one", "#plain", kNotFound},
        {"one", "spaced ", kNotFound},
        {"one", "plai", kNotFound},
        {"one", "", kNotFound},
        {"two", "", kNotFound},
        {"two] tail", "after", kNotFound},
        {"three", "plain", kNotFound},
        {"on", "plain", kNotFound},
    };
    for (const bool blKept : {false, true}) {
        for (const auto &[szSection, szKey, strValue] : rows) {
            EXPECT_EQ(Get(szSection, szKey), strValue) << szSection << ":" << szKey << blKept;
        }
        AwaitAge();
    }
}

TEST(StringsFile, CutsBetweenCharactersAndRefusesWhatItCannotUse) {
    Replace("[s]\nk=\"aé€\"\n");
    const char *const cuts[] = {"", "a", "a", "aé", "aé", "aé", "aé€", "aé€"};
    for (int cb = 1; cb <= 8; ++cb) {
        char sz[8] = "xxxxxxx";
        EXPECT_EQ(YLIBCFileGetSectionValue(kFile, "s", "k", sz, cb),
                  static_cast<int>(std::string(cuts[cb - 1]).size()));
        EXPECT_STREQ(sz, cuts[cb - 1]);
    }
    char sz[8] = "before";
    mkfifo("/tmp/fifo", 0600);
    for (const char *szPath : {"/tmp/fifo", "/tmp", "/tmp/none", "/dev/null"}) {
        EXPECT_LT(YLIBCFileGetSectionValue(szPath, "s", "k", sz, 8), 0) << szPath;
        EXPECT_EQ(YLIBCErrGet() == YLIBC_ERR_NOT_FOUND, !fs::exists(szPath));
    }
    EXPECT_EQ(FailureOf(YLIBCFileGetSectionValue(kFile, "s", nullptr, sz, 8)),
              YLIBC_ERR_INVALID_ARGUMENT);
    EXPECT_LT(YLIBCFileGetSectionValue(kFile, "s", "k", sz, 0), 0);
    EXPECT_STREQ(sz, "before");
}

TEST(StringsFile, SeesEveryChangeAtOnce) {
    const std::string strSections[] = {"[a]\nk=\"1\"\n[b]\nk=\"1\"\n",
                                       "[b]\nk=\"2\"\n[a]\nk=\"2\"\n"};
    // Changes of the same size, faster than the file's times advance.
    for (int i = 0; i < 300; ++i) {
        WriteFile(kFile, strSections[i % 2]);
        ASSERT_EQ(Get("a", "k"), i % 2 == 0 ? "1" : "2");
    }
    // Of the same size, and with the former time of modification, after the file has been kept.
    for (const bool blInPlace : {true, false}) {
        WriteFile(kFile, strSections[0]);
        AwaitAge();
        ASSERT_EQ(Get("a", "k"), "1");
        const struct stat status = Status(kFile);
        blInPlace ? WriteFile(kFile, strSections[1]) : Replace(strSections[1]);
        const timespec times[] = {status.st_atim, status.st_mtim};
        utimensat(AT_FDCWD, kFile, times, 0);
        EXPECT_EQ(Get("a", "k"), "2");
    }
    // Another file in place of one that goes on under another name.
    ASSERT_EQ(Get("a", "k"), "2");
    const std::string strFormer = std::string(kFile) + ".former";
    fs::rename(kFile, strFormer);
    WriteFile(kFile, strSections[0]);
    EXPECT_EQ(Get("a", "k"), "1");
    fs::rename(strFormer, kFile);
    AwaitAge();
    EXPECT_EQ(Get("a", "k"), "2");
    fs::resize_file(kFile, 11);
    EXPECT_EQ(Get("a", "k"), kNotFound);
    EXPECT_EQ(Get("b", "k"), "2");
    fs::remove(kFile);
    EXPECT_EQ(Get("b", "k"), kNotFound);
}

TEST(StringsFile, TakesTheMemoryThatTextsNeedAndNoMore) {
    const std::string strUnread = "-" + std::to_string(YLIBC_ERR_FILE);
    const std::string strLines = Repeated("#" + std::string(1000, ' ') + '\n', 17U << 20U);
    Replace("[small]\nk=\"1\"\n[large]\n" + strLines + "[last]\nk=\"2\"\n");
    EXPECT_EQ(Get("small", "k") + Get("last", "k"), "12");
    EXPECT_EQ(Get("large", "k"), strUnread);
    EXPECT_EQ(failures::Reason(),
              "cannot read '/tmp/strings': a line or section of it is larger than 16 MiB");
    Replace("[small]\nk=\"1\"\n" + Repeated("[]\n", 400'000));
    EXPECT_EQ(Get("small", "k"), strUnread);
    Replace("[small]\nk=\"1\"\n" + std::string(33U << 20U, 'x'));
    EXPECT_EQ(Get("small", "k"), strUnread);
}

TEST(StringsFile, IsSafeWhileTheFileIsCutShortAndProcessesFork) {
    std::string strText;
    for (int i = 0; i < 100; ++i) {
        strText += "#" + std::string(2000, ' ') + "\n[s" + std::to_string(i) + "]\nk=\"value\"\n";
    }
    Replace(strText);
    std::atomic<bool> blDone(false);
    std::atomic<int> found(0);
    std::vector<std::thread> readers;
    readers.reserve(3);
    for (int t = 0; t < 3; ++t) {
        readers.emplace_back([&, t] {
            for (int i = t; !blDone; i = (i + 7) % 100) {
                const std::string strValue = Get("s" + std::to_string(i), "k");
                EXPECT_TRUE(strValue == "value" || strValue[0] == '-') << strValue;
                found += strValue == "value" ? 1 : 0;
            }
        });
    }
    for (int i = 0; i < 150 || found < 300; ++i) {
        i % 3 == 0 ? Replace(strText)
                   : WriteFile(kFile, strText.substr(0, strText.size() * (i % 3) / 2));
    }
    Replace(strText);
    AwaitAge();
    EXPECT_EQ(Get("s1", "k"), "value");
    for (int i = 0; i < 40 && !HasFailure(); ++i) {
        EXPECT_TRUE(children::InOne([] {
            alarm(60);
            return Get("s1", "k") == "value";
        }));
    }
    blDone = true;
    for (std::thread &reader : readers) {
        reader.join();
    }
}

}  // namespace
