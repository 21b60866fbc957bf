#pragma once
// The command line: splitting one command-line string, reading the options -LF, -LV and -PKID,
// and choosing and running the verb.
//
// The argument vector holds element 0 (the program path) and then the arguments. Options may
// stand anywhere and are removed before the verb is chosen; element 1 of what is left is the verb.
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vaultora {

// Splits one command-line string: spaces separate arguments; a double quote at the start of an
// argument makes it run, without the quotes, up to the next double quote (spaces included, no
// escapes); a character right after a closing quote starts a new argument. A quote inside an
// unquoted argument is an ordinary character.
std::vector<std::string> splitCommandLine(std::string_view line);

// Reads one option from `args` and removes it, comparing names case-insensitively (ASCII):
//  1. from the end towards element 1, an element equal to `name`: the value is the element after
//     it and both are removed; when it is the last element the option is absent and stays;
//  2. otherwise, from the end, an element beginning with `name`: "NAME=" takes the next element
//     (both removed; absent when there is none), "NAME=value" and "NAMEvalue" give the text after
//     "=" or after the name (only the element is removed).
std::optional<std::string> takeOption(std::vector<std::string>& args, std::string_view name);
// Reads every occurrence of a repeatable option, the last on the line first. A trailing
// occurrence without a value stays in the vector but does not hide the ones before it.
std::vector<std::string> takeAllOptions(std::vector<std::string>& args, std::string_view name);

// The batch settings of the process, read from the options before the verb runs.
struct BatchSettings {
    std::optional<std::string> logPath;   // -LV or -LF: the batch log file
    bool verbose = false;                 // -LV was given
    std::vector<std::string> recipients;  // every -PKID, the last on the line first
};
// Reads -LV, then -LF, then every -PKID from `args`, removing them. With both -LV and -LF the log
// is the -LV file.
BatchSettings readBatchOptions(std::vector<std::string>& args);
// The process-wide batch settings (set once at start-up, before any other thread runs).
BatchSettings& batchSettings();

// The rows of the command table, in the order they are checked.
enum class Verb {
    kNone,                // no verb: main window without an archive
    kClipboardAuto,
    kClipboardDecode,
    kClipboardEncode,
    kCheckSelfExtracted,
    kMakeSelfExtracted,
    kAdd,
    kEncrypt,
    kExtract,
    kShowPkid,
    kSend,
    kBareArchive,         // the program started with an archive path alone: main window on it
    kOpen,
    kNew,
    kProperties,
    kShowKeyManager,
    kDelete,
    kUsage,               // anything else: the usage text
};

// The verb's command-line name ("Add", "ShowHXKeyMan", ...); a description for kNone,
// kBareArchive and kUsage.
std::string_view verbName(Verb verb);
// How many arguments after the verb it needs at least.
size_t verbMinArguments(Verb verb);

// True when the raw vector (before options are removed) has exactly two elements and element 1
// is longer than four characters, ends in ".vra" (case-sensitively) and names an existing file.
bool isBareArchive(const std::vector<std::string>& rawArgs);
// The row of the command table that `args` (after option removal) selects.
Verb chooseVerb(const std::vector<std::string>& args, bool bareArchive);

// What a verb handler is given.
struct Invocation {
    Verb verb;
    const std::vector<std::string>& args;  // after option removal; args[1] is the verb or the archive
    const BatchSettings& batch;
};
// A verb: runs and returns the process's exit code.
using VerbHandler = std::function<int(const Invocation&)>;

// Exit codes of the start-up itself (-1 and -2 are the exit statuses 255 and 254).
inline constexpr int kExitFailure = -1;
inline constexpr int kExitUnusable = -2;  // "checkSelfExtracted" found no usable base
inline constexpr int kExitTooFewArguments = 104;

// The command table. Every verb starts as "not available yet" (a line on standard error naming
// the verb, exit -1) and kUsage prints the usage text on standard output (exit -1); the program
// and its later parts replace handlers with setHandler.
class CommandTable {
public:
    CommandTable();
    void setHandler(Verb verb, VerbHandler handler);
    // Shows "Invalid argument" for "Add"/"Encrypt" with too few arguments (default: a line on
    // standard error); the program sets the batch-aware message here.
    void setInvalidArgumentReporter(std::function<void(const Invocation&)> reporter);
    // Runs the verb. A verb given fewer arguments than it needs runs the kUsage handler instead,
    // except "Add" and "Encrypt", which report "Invalid argument" and give 104.
    int dispatch(const Invocation& call) const;

private:
    std::vector<VerbHandler> m_handlers;
    std::function<void(const Invocation&)> m_invalidArgument;
};

// The usage text (UTF-8, "\n" line ends) and its output on standard output.
std::string usageText();
int showUsage(const Invocation& call);
// The placeholder of verbs not built yet.
int verbNotAvailable(const Invocation& call);

// The whole start-up after the vector is built: computes the bare-archive flag, reads the options
// into batchSettings(), chooses the verb and runs it; returns the exit code.
int runCommandLine(std::vector<std::string> args, const CommandTable& table);

}  // namespace vaultora
