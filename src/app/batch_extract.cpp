#include "app/batch_extract.h"

#include <cerrno>

#include "archive/extract.h"
#include "platform/file.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

int batchExtract(const std::vector<std::string>& args, VerbSession& session) {
    if (args.size() < 4) return kExitFailure;
    const std::string& archivePath = args[2];
    std::string destination = args[3];
    while (destination.size() > 1 && destination.back() == '/') destination.pop_back();
    std::vector<std::string> patterns(args.begin() + 4, args.end());
    if (patterns.empty()) patterns.push_back("*");

    if (Result rc = session.loadPasswordFile(); rc != kOk) return static_cast<int>(rc);
    Vaultora archive(archivePath, &session.ui());
    Result rc = session.openArchive(archive);
    if (rc != kOk) {
        if (rc != kCancelled && rc != kWrongPassword)
            session.ui().message(msgFormat(Msg::kOpenError, {static_cast<unsigned>(rc)}),
                                 msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconError);
        return static_cast<int>(rc);
    }
    if (!fs::isDirectory(destination) && !fs::createDirectories(destination, 0700)) {
        session.ui().message(msgFormat(Msg::kErrorCreatingDirectory, {fs::errorText(errno), destination}),
                             msgText(Msg::kCaptionAttention), mb::kOk | mb::kIconError);
        archive.close();
        return static_cast<int>(kCannotOpen);
    }
    for (const std::string& pattern : patterns) {
        std::u16string path = fromUtf8(pattern);
        for (char16_t& c : path)
            if (c == u'/') c = u'\\';
        // A pattern below a folder extracts into the same folder below the destination.
        const size_t cut = path.find_last_of(u'\\');
        if (cut != std::u16string::npos && cut > 0) {
            const std::u16string folder = path.substr(0, cut);
            const size_t up = folder.find_last_of(u'\\');
            const std::u16string parent = up == std::u16string::npos ? u"" : folder.substr(0, up);
            const std::u16string last = up == std::u16string::npos ? folder : folder.substr(up + 1);
            (void)fs::createDirectories(diskPathOfUnit(destination, parent, last), 0700);
        }
        cExtractFileActorBlock actor(archive, destination, 0);
        rc = walkPath(archive, path, actor);
    }
    Result closed = archive.close();
    if (rc == kOk) rc = closed;
    return static_cast<int>(rc);
}

int runExtract(const Invocation& call) {
    VerbSession session(call.batch);
    return batchExtract(call.args, session);
}

}  // namespace vaultora
