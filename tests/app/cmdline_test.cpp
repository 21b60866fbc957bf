#include "app/cmdline.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <string>
#include <vector>

#include "platform/file.h"
#include "support/temp_dir.h"

extern char** environ;

namespace vaultora {
namespace {

using Args = std::vector<std::string>;
using test::TempDir;

TEST(CommandLineSplit, SpacesSeparateAndLeadingQuoteRunsToNextQuote) {
    struct Case {
        const char* line;
        Args expected;
    } cases[] = {
        {"vaultora  Add   a.vra b", {"vaultora", "Add", "a.vra", "b"}},
        {"\"C:\\Program Files\\v.exe\" Open \"C:\\My archive.vra\"",
         {"C:\\Program Files\\v.exe", "Open", "C:\\My archive.vra"}},
        {"a\"b c\"", {"a\"b", "c\""}},       // a quote inside an argument is ordinary
        {"\"ab\"cd \"e f\"g", {"ab", "cd", "e f", "g"}},  // text after a closing quote is a new argument
        {"x \"\" y", {"x", "", "y"}},
        {"open \"unclosed  quote", {"open", "unclosed  quote"}},
        {"  ", {}},
        {"", {}},
        {"back\\slash \\\"x", {"back\\slash", "\\\"x"}},  // no escape character
    };
    for (const Case& c : cases) EXPECT_EQ(splitCommandLine(c.line), c.expected) << c.line;
}

TEST(CommandLineOptions, EveryValueFormGivesTheSameLogFile) {
    struct Case {
        Args in;
        Args rest;
    } cases[] = {
        {{"v", "Add", "-LF", "log.txt", "a.vra"}, {"v", "Add", "a.vra"}},
        {{"v", "Add", "a.vra", "-LF=log.txt"}, {"v", "Add", "a.vra"}},
        {{"v", "-LFlog.txt", "Add", "a.vra"}, {"v", "Add", "a.vra"}},
        {{"v", "Add", "-LF=", "log.txt", "a.vra"}, {"v", "Add", "a.vra"}},
        {{"v", "Add", "-lf", "log.txt"}, {"v", "Add"}},
        {{"v", "Add", "-lF=log.txt"}, {"v", "Add"}},
    };
    for (Case& c : cases) {
        Args args = c.in;
        EXPECT_EQ(takeOption(args, "-LF"), "log.txt") << c.in[2];
        EXPECT_EQ(args, c.rest) << c.in[2];
    }
}

TEST(CommandLineOptions, TrailingOptionWithoutValueIsAbsentAndStays) {
    Args args{"v", "Delete", "a.vra", "-LF"};
    EXPECT_FALSE(takeOption(args, "-LF"));
    EXPECT_EQ(args, (Args{"v", "Delete", "a.vra", "-LF"}));

    args = {"v", "Delete", "-LF="};
    EXPECT_FALSE(takeOption(args, "-LF"));
    EXPECT_EQ(args.size(), 3u);

    // Element 0 is the program path, never an option.
    args = {"-LF", "x"};
    EXPECT_FALSE(takeOption(args, "-LF"));
    EXPECT_EQ(args.size(), 2u);
}

TEST(CommandLineOptions, SearchGoesFromTheEndAndPrefersWholeNames) {
    Args args{"v", "-LF", "first", "Add", "-LF", "second"};
    EXPECT_EQ(takeOption(args, "-LF"), "second");
    EXPECT_EQ(args, (Args{"v", "-LF", "first", "Add"}));

    // An element equal to the name wins over a later one that merely begins with it.
    args = {"v", "-LF", "a", "-LFb"};
    EXPECT_EQ(takeOption(args, "-LF"), "a");
    EXPECT_EQ(args, (Args{"v", "-LFb"}));

    // "-LV" is not "-LF".
    args = {"v", "-LVx"};
    EXPECT_FALSE(takeOption(args, "-LF"));
}

TEST(CommandLineOptions, RecipientsAreCollectedLastFirst) {
    Args args{"v", "Add", "-PKID", "k1", "a.vra", "-pkid", "k2", "b", "-PKID", "k3"};
    EXPECT_EQ(takeAllOptions(args, "-PKID"), (Args{"k3", "k2", "k1"}));
    EXPECT_EQ(args, (Args{"v", "Add", "a.vra", "b"}));

    // Each lookup tries whole-name elements before joined forms, wherever they stand.
    args = {"v", "Add", "-PKID", "k1", "a.vra", "-pkid=k2", "b", "-PKIDk3"};
    EXPECT_EQ(takeAllOptions(args, "-PKID"), (Args{"k1", "k3", "k2"}));
    EXPECT_EQ(args, (Args{"v", "Add", "a.vra", "b"}));

    // A trailing -PKID without a value stays but the recipients before it still count.
    args = {"v", "Add", "a.vra", "b", "-PKID", "k1", "-PKID"};
    EXPECT_EQ(takeAllOptions(args, "-PKID"), (Args{"k1"}));
    EXPECT_EQ(args, (Args{"v", "Add", "a.vra", "b", "-PKID"}));
}

TEST(CommandLineOptions, BatchOptionsSetLogVerboseAndRecipients) {
    Args args{"v", "Add", "-LV", "verbose.log", "a.vra", "-PKID", "k1", "x"};
    BatchSettings s = readBatchOptions(args);
    EXPECT_EQ(s.logPath, "verbose.log");
    EXPECT_TRUE(s.verbose);
    EXPECT_EQ(s.recipients, (Args{"k1"}));
    EXPECT_EQ(args, (Args{"v", "Add", "a.vra", "x"}));

    args = {"v", "Extract", "-LF", "plain.log", "a", "b"};
    s = readBatchOptions(args);
    EXPECT_EQ(s.logPath, "plain.log");
    EXPECT_FALSE(s.verbose);
    EXPECT_TRUE(s.recipients.empty());

    args = {"v", "-LF", "plain.log", "-LV", "verbose.log"};
    s = readBatchOptions(args);
    EXPECT_EQ(s.logPath, "verbose.log");
    EXPECT_TRUE(s.verbose);
    EXPECT_EQ(args, (Args{"v"}));
}

TEST(CommandLineVerbs, VerbsMatchIgnoringCaseAndUnknownOnesGiveUsage) {
    EXPECT_EQ(chooseVerb({"v"}, false), Verb::kNone);
    EXPECT_EQ(chooseVerb({"v", "add", "a", "b"}, false), Verb::kAdd);
    EXPECT_EQ(chooseVerb({"v", "ENCRYPT"}, false), Verb::kEncrypt);
    EXPECT_EQ(chooseVerb({"v", "showhxkeyman"}, false), Verb::kShowKeyManager);
    EXPECT_EQ(chooseVerb({"v", "MakeSelfExtracted", "a"}, false), Verb::kMakeSelfExtracted);
    EXPECT_EQ(chooseVerb({"v", "Opens"}, false), Verb::kUsage);
    EXPECT_EQ(chooseVerb({"v", "a.vra"}, false), Verb::kUsage);
    EXPECT_EQ(chooseVerb({"v", "a.vra"}, true), Verb::kBareArchive);
}

TEST(CommandLineVerbs, BareArchiveNeedsAnExistingFileEndingInLowerCaseVra) {
    TempDir dir;
    std::string archive = dir / "my archive.vra";
    std::string upper = dir / "UPPER.VRA";
    ASSERT_TRUE(fs::writeWholeFile(archive, "x", 1));
    ASSERT_TRUE(fs::writeWholeFile(upper, "x", 1));
    ASSERT_TRUE(fs::createDirectories(dir / "folder.vra"));
    EXPECT_TRUE(isBareArchive({"v", archive}));
    EXPECT_FALSE(isBareArchive({"v", upper}));
    EXPECT_FALSE(isBareArchive({"v", dir / "missing.vra"}));
    EXPECT_FALSE(isBareArchive({"v", dir / "folder.vra"}));
    EXPECT_FALSE(isBareArchive({"v", archive, "x"}));
    EXPECT_FALSE(isBareArchive({"v", ".vra"}));
}

// A table whose handlers record what they were given.
struct RecordingTable {
    CommandTable table;
    std::vector<Verb> ran;
    Args lastArgs;
    BatchSettings lastBatch;
    RecordingTable() {
        for (int v = 0; v <= static_cast<int>(Verb::kUsage); ++v)
            table.setHandler(static_cast<Verb>(v), [this](const Invocation& call) {
                ran.push_back(call.verb);
                lastArgs = call.args;
                lastBatch = call.batch;
                return 7;
            });
    }
};

TEST(CommandLineDispatch, HandlerGetsArgumentsAfterOptionRemoval) {
    RecordingTable t;
    EXPECT_EQ(runCommandLine({"v", "-LV", "log", "add", "a.vra", "-PKID", "k", "item"}, t.table), 7);
    ASSERT_EQ(t.ran, std::vector<Verb>{Verb::kAdd});
    EXPECT_EQ(t.lastArgs, (Args{"v", "add", "a.vra", "item"}));
    EXPECT_EQ(t.lastBatch.logPath, "log");
    EXPECT_TRUE(t.lastBatch.verbose);
    EXPECT_EQ(t.lastBatch.recipients, Args{"k"});
    EXPECT_EQ(batchSettings().recipients, Args{"k"});
}

TEST(CommandLineDispatch, TooFewArgumentsGiveUsageOrInvalidArgument) {
    RecordingTable t;
    EXPECT_EQ(runCommandLine({"v", "Open"}, t.table), 7);
    EXPECT_EQ(runCommandLine({"v", "Extract", "a.vra"}, t.table), 7);
    EXPECT_EQ(runCommandLine({"v", "Delete", "-LF", "log"}, t.table), 7);  // the option is no argument
    EXPECT_EQ(t.ran, (std::vector<Verb>{Verb::kUsage, Verb::kUsage, Verb::kUsage}));
    t.ran.clear();
    EXPECT_EQ(runCommandLine({"v", "Add", "a.vra"}, t.table), 104);
    EXPECT_EQ(runCommandLine({"v", "Encrypt", "a.vra", "-PKID", "k"}, t.table), 104);
    EXPECT_TRUE(t.ran.empty());
    EXPECT_EQ(runCommandLine({"v", "Extract", "a.vra", "dest"}, t.table), 7);
    EXPECT_EQ(runCommandLine({"v", "ShowPKID"}, t.table), 7);
    EXPECT_EQ(t.ran, (std::vector<Verb>{Verb::kExtract, Verb::kShowPkid}));
}

TEST(CommandLineDispatch, BareArchiveIsJudgedBeforeOptionsAreRemoved) {
    TempDir dir;
    std::string archive = dir / "a.vra";
    ASSERT_TRUE(fs::writeWholeFile(archive, "x", 1));
    RecordingTable t;
    runCommandLine({"v", archive}, t.table);
    runCommandLine({"v", archive, "-LF", "log"}, t.table);  // three raw elements: not a bare archive
    EXPECT_EQ(t.ran, (std::vector<Verb>{Verb::kBareArchive, Verb::kUsage}));
}

// ---- The built program ----------------------------------------------------------------------

struct RunResult {
    int status = -1;  // exit status, -1 when it did not exit normally
    std::string out, err;
};

RunResult runProgram(const Args& args, const std::string& cwd = "") {
    TempDir dir;
    std::string outPath = dir / "out", errPath = dir / "err";
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 1, outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    posix_spawn_file_actions_addopen(&actions, 2, errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    if (!cwd.empty()) posix_spawn_file_actions_addchdir_np(&actions, cwd.c_str());
    std::vector<char*> argv;
    std::string program = VAULTORA_BINARY;
    argv.push_back(program.data());
    std::vector<std::string> copy = args;
    for (std::string& a : copy) argv.push_back(a.data());
    argv.push_back(nullptr);
    RunResult r;
    pid_t pid = 0;
    if (posix_spawn(&pid, program.c_str(), &actions, nullptr, argv.data(), environ) == 0) {
        int status = 0;
        if (waitpid(pid, &status, 0) == pid && WIFEXITED(status)) r.status = WEXITSTATUS(status);
    }
    posix_spawn_file_actions_destroy(&actions);
    std::vector<uint8_t> bytes;
    if (fs::readWholeFile(outPath, bytes)) r.out.assign(bytes.begin(), bytes.end());
    if (fs::readWholeFile(errPath, bytes)) r.err.assign(bytes.begin(), bytes.end());
    return r;
}

TEST(CommandLineProgram, UnknownVerbPrintsUsageAndExitsMinusOne) {
    RunResult r = runProgram({"frobnicate"});
    EXPECT_EQ(r.status, 255);
    EXPECT_EQ(r.out, usageText());
    EXPECT_EQ(r.out.rfind("\nVaultora command line usage.\n\n1. Open existing archive.\n", 0), 0u);
    EXPECT_TRUE(r.out.ends_with("\n   -LF logFileName\n      Writes messages to the file in batch mode.\n\n\n"));
    EXPECT_NE(r.out.find("\n\t-PKID publicKeyID\n"), std::string::npos);
    EXPECT_NE(r.out.find("* means any symbols is allowed \n"), std::string::npos);
    EXPECT_EQ(r.out.find('\r'), std::string::npos);
    EXPECT_TRUE(r.err.empty());
}

TEST(CommandLineProgram, PlaceholdersMissingArgumentsAndExitStatuses) {
    RunResult r = runProgram({"send", "item", "-LF", "log.txt"});
    EXPECT_EQ(r.status, 255);
    EXPECT_TRUE(r.out.empty());
    EXPECT_NE(r.err.find("Send: not available yet"), std::string::npos) << r.err;

    r = runProgram({});
    EXPECT_EQ(r.status, 255);
    EXPECT_NE(r.err.find("not available yet"), std::string::npos);

    TempDir dir;
    ASSERT_TRUE(fs::writeWholeFile(dir / "a.vra", "x", 1));
    r = runProgram({"a.vra"}, dir.path());
    EXPECT_EQ(r.status, 255);
    EXPECT_NE(r.err.find("archive: not available yet"), std::string::npos) << r.err;

    r = runProgram({"Open"});
    EXPECT_EQ(r.status, 255);
    EXPECT_EQ(r.out, usageText());

    r = runProgram({"Add", "a.vra", "-LF"}, dir.path());  // the trailing -LF stays: an item that is not there
    EXPECT_EQ(r.status, 104);
    EXPECT_NE(r.err.find("Invalid argument"), std::string::npos);
    EXPECT_FALSE(fs::exists(dir / "a.vra.vrt"));

    r = runProgram({"add", "a.vra"});
    EXPECT_EQ(r.status, 104);
    EXPECT_NE(r.err.find("Invalid argument"), std::string::npos);
    EXPECT_TRUE(r.out.empty());
}


}  // namespace
}  // namespace vaultora
