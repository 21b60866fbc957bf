#include "app/cmdline.h"

#include <cstdio>
#include <iterator>

#include "platform/file.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

std::vector<std::string> splitCommandLine(std::string_view line) {
    std::vector<std::string> out;
    size_t i = 0;
    const size_t n = line.size();
    while (i < n) {
        if (line[i] == ' ') {
            ++i;
            continue;
        }
        if (line[i] == '"') {
            size_t close = line.find('"', i + 1);
            if (close == std::string_view::npos) close = n;  // an unclosed quote runs to the end
            out.emplace_back(line.substr(i + 1, close - i - 1));
            i = close + 1;  // whatever follows the closing quote starts a new argument
            continue;
        }
        size_t end = line.find(' ', i);
        if (end == std::string_view::npos) end = n;
        out.emplace_back(line.substr(i, end - i));
        i = end;
    }
    return out;
}

namespace {

bool startsWithIgnoreCase(std::string_view s, std::string_view prefix) {
    return s.size() >= prefix.size() && equalsIgnoreCaseAscii(s.substr(0, prefix.size()), prefix);
}

// The option lookup. With `collecting`, an occurrence that lacks its value because it ends the
// vector is passed over (it stays) and the search goes on towards the front.
std::optional<std::string> lookUp(std::vector<std::string>& args, std::string_view name, bool collecting) {
    for (size_t i = args.size(); i-- > 1;) {
        if (!equalsIgnoreCaseAscii(args[i], name)) continue;
        if (i + 1 < args.size()) {
            std::string value = args[i + 1];
            args.erase(args.begin() + static_cast<long>(i), args.begin() + static_cast<long>(i) + 2);
            return value;
        }
        if (!collecting) return std::nullopt;
    }
    for (size_t i = args.size(); i-- > 1;) {
        if (args[i].size() <= name.size() || !startsWithIgnoreCase(args[i], name)) continue;
        std::string rest = args[i].substr(name.size());
        if (rest == "=") {
            if (i + 1 < args.size()) {
                std::string value = args[i + 1];
                args.erase(args.begin() + static_cast<long>(i), args.begin() + static_cast<long>(i) + 2);
                return value;
            }
            if (collecting) continue;
            return std::nullopt;
        }
        args.erase(args.begin() + static_cast<long>(i));
        return rest[0] == '=' ? rest.substr(1) : rest;
    }
    return std::nullopt;
}

struct VerbRow {
    Verb verb;
    std::string_view name;
    size_t minArguments;
};

// The command table in the order it is checked.
constexpr VerbRow kVerbs[] = {
    {Verb::kNone, "main window", 0},
    {Verb::kClipboardAuto, "clipboardAuto", 0},
    {Verb::kClipboardDecode, "clipboardDecode", 0},
    {Verb::kClipboardEncode, "clipboardEncode", 0},
    {Verb::kCheckSelfExtracted, "checkSelfExtracted", 0},
    {Verb::kMakeSelfExtracted, "makeSelfExtracted", 1},  // archive [exe path]
    {Verb::kAdd, "Add", 2},                              // archive item...
    {Verb::kEncrypt, "Encrypt", 2},
    {Verb::kExtract, "Extract", 2},  // archive destination [pattern...]
    {Verb::kShowPkid, "ShowPKID", 0},
    {Verb::kSend, "Send", 1},  // item
    {Verb::kBareArchive, "archive", 0},
    {Verb::kOpen, "Open", 1},          // archive
    {Verb::kNew, "New", 1},            // archive
    {Verb::kProperties, "Properties", 1},  // request file
    {Verb::kShowKeyManager, "ShowHXKeyMan", 0},
    {Verb::kDelete, "Delete", 1},  // archive
    {Verb::kUsage, "usage", 0},
};

constexpr bool inEnumOrder() {
    for (size_t i = 0; i < std::size(kVerbs); ++i)
        if (static_cast<size_t>(kVerbs[i].verb) != i) return false;
    return static_cast<size_t>(Verb::kUsage) + 1 == std::size(kVerbs);
}
static_assert(inEnumOrder(), "the verb table is indexed by Verb");

const VerbRow& row(Verb verb) { return kVerbs[static_cast<size_t>(verb)]; }

// The verbs that are matched by name.
bool matchedByName(Verb verb) {
    return verb != Verb::kNone && verb != Verb::kBareArchive && verb != Verb::kUsage;
}

void writeOut(std::FILE* f, const std::string& text) {
    std::fwrite(text.data(), 1, text.size(), f);
    std::fflush(f);
}

}  // namespace

std::optional<std::string> takeOption(std::vector<std::string>& args, std::string_view name) {
    return lookUp(args, name, false);
}

std::vector<std::string> takeAllOptions(std::vector<std::string>& args, std::string_view name) {
    std::vector<std::string> values;
    while (std::optional<std::string> v = lookUp(args, name, true)) values.push_back(std::move(*v));
    return values;
}

BatchSettings readBatchOptions(std::vector<std::string>& args) {
    BatchSettings s;
    std::optional<std::string> verboseLog = takeOption(args, "-LV");
    std::optional<std::string> log = takeOption(args, "-LF");
    if (verboseLog) {
        s.logPath = verboseLog;
        s.verbose = true;
    } else {
        s.logPath = log;
    }
    s.recipients = takeAllOptions(args, "-PKID");
    return s;
}

BatchSettings& batchSettings() {
    static BatchSettings settings;
    return settings;
}

std::string_view verbName(Verb verb) { return row(verb).name; }
size_t verbMinArguments(Verb verb) { return row(verb).minArguments; }

bool isBareArchive(const std::vector<std::string>& rawArgs) {
    if (rawArgs.size() != 2) return false;
    const std::string& path = rawArgs[1];
    return path.size() > 4 && path.compare(path.size() - 4, 4, ".vra") == 0 && fs::exists(path) &&
           !fs::isDirectory(path);
}

Verb chooseVerb(const std::vector<std::string>& args, bool bareArchive) {
    if (args.size() < 2) return Verb::kNone;
    for (const VerbRow& r : kVerbs) {
        if (r.verb == Verb::kBareArchive && bareArchive) return Verb::kBareArchive;
        if (matchedByName(r.verb) && equalsIgnoreCaseAscii(args[1], r.name)) return r.verb;
    }
    return Verb::kUsage;
}

std::string usageText() { return toUtf8(msgText(Msg::kUsageText)); }

int showUsage(const Invocation&) {
    writeOut(stdout, usageText());
    return kExitFailure;
}

int verbNotAvailable(const Invocation& call) {
    writeOut(stderr, std::string(verbName(call.verb)) + ": " +
                         toUtf8(msgText(Msg::kNotAvailableYet)) + "\n");
    return kExitFailure;
}

CommandTable::CommandTable() : m_handlers(std::size(kVerbs), verbNotAvailable) {
    m_handlers[static_cast<size_t>(Verb::kUsage)] = showUsage;
}

void CommandTable::setInvalidArgumentReporter(std::function<void(const Invocation&)> reporter) {
    m_invalidArgument = std::move(reporter);
}

void CommandTable::setHandler(Verb verb, VerbHandler handler) {
    m_handlers[static_cast<size_t>(verb)] = std::move(handler);
}

int CommandTable::dispatch(const Invocation& call) const {
    // Arguments after the verb; the bare archive and "no verb" rows read none.
    size_t given = call.args.size() > 2 ? call.args.size() - 2 : 0;
    if (given < verbMinArguments(call.verb)) {
        if (call.verb == Verb::kAdd || call.verb == Verb::kEncrypt) {
            if (m_invalidArgument) m_invalidArgument(call);
            else writeOut(stderr, toUtf8(msgText(Msg::kInvalidArgument)) + "\n");
            return kExitTooFewArguments;
        }
        return m_handlers[static_cast<size_t>(Verb::kUsage)](Invocation{Verb::kUsage, call.args, call.batch});
    }
    return m_handlers[static_cast<size_t>(call.verb)](call);
}

int runCommandLine(std::vector<std::string> args, const CommandTable& table) {
    bool bare = isBareArchive(args);
    BatchSettings& batch = batchSettings();
    batch = readBatchOptions(args);
    Verb verb = chooseVerb(args, bare);
    return table.dispatch(Invocation{verb, args, batch});
}

}  // namespace vaultora
