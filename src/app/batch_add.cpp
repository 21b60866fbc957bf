#include "app/batch_add.h"

#include <unistd.h>

#include "app/autorun.h"
#include "app/list_file.h"
#include "operations/add.h"
#include "platform/disk_names.h"
#include "platform/file.h"
#include "platform/messages.h"
#include "platform/settings.h"
#include "platform/text.h"

namespace vaultora {

namespace {

std::string lastComponent(std::string path) {
    while (path.size() > 1 && path.back() == '/') path.pop_back();
    const size_t slash = path.find_last_of('/');
    return slash == std::string::npos ? path : path.substr(slash + 1);
}

// Writes the collected messages of one item (or "No error!") to the log; a log that cannot be
// written is shown as an ordinary message. Without a log they go to the error output.
void reportCollected(VerbSession& session, const std::u16string& collected) {
    if (BatchLog* log = session.log()) {
        std::u16string text = collected.empty() ? std::u16string(msgText(Msg::kNoError)) : collected;
        while (!text.empty() && (text.back() == u'\n' || text.back() == u'\r')) text.pop_back();
        if (!log->lines(text))
            session.plainUi().message(msgText(Msg::kErrorWritingLog), msgText(Msg::kCaptionVaultora),
                                      mb::kOk | mb::kIconError);
        return;
    }
    if (!collected.empty()) {
        std::string bytes = toUtf8(collected);
        if (bytes.back() != '\n') bytes += "\n";
        (void)!::write(STDERR_FILENO, bytes.data(), bytes.size());
    }
}

// Adds one item into the archive's root folder.
Result addItem(Vaultora& archive, VerbSession& session, const std::string& item, bool collect) {
    std::u16string collected;
    AddOptions options;
    uint32_t cancel = 0;
    options.cancelFlag = &cancel;
    if (collect) {
        archive.collectedMessages = &collected;
        options.verboseLog = session.batch().verbose;
        if (BatchLog* log = session.log()) {
            options.batchLog = [log](std::u16string_view text) { (void)log->line(text); };
        } else {
            options.batchLog = [](std::u16string_view text) {
                std::string bytes = toUtf8(text) + "\n";
                (void)!::write(STDERR_FILENO, bytes.data(), bytes.size());
            };
        }
    }
    Result rc;
    {
        Adder adder(archive, options);
        ToAllFlags flags;
        rc = adder.AddTree(u"", item, flags, kModePlain);
        if (Result f = adder.flush(); rc == kOk) rc = f;
    }
    if (Result f = archive.flushDirectoryCache(); rc == kOk) rc = f;
    archive.collectedMessages = nullptr;
    archive.pCancelFlag = nullptr;
    if (collect) reportCollected(session, collected);
    return rc;
}

}  // namespace

void reportInvalidArgument(const Invocation& call) {
    VerbSession session(call.batch);
    session.ui().message(msgText(Msg::kInvalidArgument), msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconError);
}

int batchAdd(const std::vector<std::string>& args, bool encrypt, VerbSession& session) {
    if (args.size() < 4) {
        session.ui().message(msgText(Msg::kInvalidArgument), msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconError);
        return kExitTooFewArguments;
    }
    ItemList items;
    std::string failedList;
    const bool listsRead = expandItems({args.begin() + 3, args.end()}, items, failedList);
    // The list files marked "@*" are wiped when the run ends, whatever its outcome.
    struct WipeLists {
        const ItemList& items;
        ~WipeLists() {
            for (const std::string& p : items.wipeAtEnd) (void)wipeAndDelete(p);
        }
    } wipeLists{items};
    if (!listsRead || items.paths.empty() || !fs::exists(items.paths.front())) {
        session.ui().message(msgText(Msg::kInvalidArgument), msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconError);
        return kExitTooFewArguments;
    }

    std::string archivePath = args[2];
    if (archivePath == "*") archivePath = archiveNameForItem(items.paths.front(), fs::isDirectory(items.paths.front()));
    const bool exists = fs::exists(archivePath);
    if (!session.batch().recipients.empty()) {
        if (exists) {
            session.ui().message(msgText(Msg::kArchiveByPublicKey), msgText(Msg::kCaptionVaultora),
                                 mb::kOk | mb::kIconError);
            return kDecryptFailed;  // 88
        }
        session.ui().message(msgText(Msg::kPublicKeyNotAvailable), msgText(Msg::kCaptionVaultora),
                             mb::kOk | mb::kIconError);
        return kExitFailure;
    }
    if (Result rc = session.loadPasswordFile(); rc != kOk) return static_cast<int>(rc);

    Vaultora archive(archivePath, &session.ui());
    Result rc = exists ? session.openArchive(archive) : session.createArchive(archive);
    if (rc != kOk) {
        if (rc != kCancelled && rc != kWrongPassword)
            session.ui().message(msgFormat(Msg::kOpenError, {static_cast<unsigned>(rc)}),
                                 msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconError);
        return static_cast<int>(rc);
    }

    // Messages are collected instead of asked when a log takes them or when nobody could answer.
    TerminalInteraction* terminal = dynamic_cast<TerminalInteraction*>(&session.plainUi());
    const bool collect = session.log() != nullptr || (terminal != nullptr && !terminal->hasTerminal());
    for (const std::string& item : items.paths) {
        if (BatchLog* log = session.log())
            (void)log->line(msgFormat(Msg::kAddFileToArchive, {item, archivePath}));
        // "folder/" names the folder itself, as "folder" does.
        std::string source = item;
        while (source.size() > 1 && source.back() == '/') source.pop_back();
        rc = addItem(archive, session, source, collect);
        if (rc != kOk) break;
    }
    if (rc != kOk && rc != kCancelled)
        session.ui().message(msgFormat(Msg::kErrorNumber, {static_cast<unsigned>(rc)}), msgText(Msg::kAddFilesToArchive),
                             mb::kOk | mb::kIconError);

    if (rc == kOk && encrypt) {
        AutoRunSettings autorun;
        autorun.openFile = unitNameFromDisk(lastComponent(items.paths.front()));
        autorun.exitOnClose = true;
        rc = writeAutoRun(autorun, archive);
        if (rc == kOk) (void)setFramePosFlag(FramePos::kUseAutoRun, true);
    }
    Result closed = archive.close();
    if (rc == kOk) rc = closed;
    return static_cast<int>(rc);
}

int runAdd(const Invocation& call) {
    VerbSession session(call.batch);
    return batchAdd(call.args, call.verb == Verb::kEncrypt, session);
}

}  // namespace vaultora
