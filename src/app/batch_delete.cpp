#include "app/batch_delete.h"

#include "platform/file.h"
#include "platform/messages.h"

namespace vaultora {

namespace {

// Deletes the path; when it is still there, the same path with "$Qemar41" appended (the name a
// protecting file-system filter may serve). True when the path is gone.
bool deleteFileRetry(const std::string& path) {
    if (fs::removeFile(path)) return true;
    (void)fs::removeFile(path + "$Qemar41");
    return !fs::exists(path);
}

}  // namespace

int batchDelete(const std::vector<std::string>& args, VerbSession& session) {
    if (args.size() < 3) return kExitFailure;
    const std::string& path = args[2];
    if (!fs::exists(path)) return 0;
    if (session.loadPasswordFile() != kOk) return kExitFailure;
    {
        Vaultora archive(path, &session.ui());
        Result rc = session.openArchive(archive);
        if (rc != kOk) {
            if (rc != kCancelled && rc != kWrongPassword)
                session.ui().message(msgFormat(Msg::kOpenError, {static_cast<unsigned>(rc)}),
                                     msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconError);
            return kExitFailure;
        }
        // Closing finishes whatever an earlier run left in the temporary folder and removes it.
        archive.close();
    }
    if (!deleteFileRetry(path)) return kExitFailure;
    if (fs::isDirectory(path + ".vrt")) (void)fs::removeTree(path + ".vrt");
    return 0;
}

int runDelete(const Invocation& call) {
    VerbSession session(call.batch);
    return batchDelete(call.args, session);
}

}  // namespace vaultora
