#include "app/verb_session.h"

#include <unistd.h>

#include "app/archive_probe.h"
#include "app/password_file.h"
#include "archive/password_ops.h"
#include "crypto/key_block_params.h"
#include "platform/messages.h"
#include "platform/settings.h"
#include "platform/text.h"

namespace vaultora {

VerbSession::VerbSession(const BatchSettings& batch) : m_batch(batch) {
    m_terminal = TerminalInteraction::onControllingTerminal();
    m_plain = m_terminal.get();
    m_ui = m_plain;
    if (batch.logPath) {
        m_log = std::make_unique<BatchLog>(*batch.logPath, batch.verbose);
        m_logUi = std::make_unique<BatchLogInteraction>(*m_log, *m_terminal);
        m_ui = m_logUi.get();
    }
}

VerbSession::VerbSession(const BatchSettings& batch, Interaction& ui) : m_batch(batch), m_ui(&ui), m_plain(&ui) {
    if (batch.logPath) m_log = std::make_unique<BatchLog>(*batch.logPath, batch.verbose);
}

Result VerbSession::loadPasswordFile() {
    std::optional<std::string> path = passwordFileFromEnvironment();
    if (!path) return kOk;
    PasswordRecord pw;
    std::string reason;
    if (Result rc = readPasswordFile(*path, pw, reason); rc != kOk) {
        const std::u16string text = msgFormat(Msg::kPasswordFileUnreadable, {*path, reason});
        if (m_log) (void)m_log->line(text, msgText(Msg::kCaptionError));
        std::string line = toUtf8(text) + "\n";
        (void)!::write(STDERR_FILENO, line.data(), line.size());
        return rc;
    }
    setPasswordFromFile(pw);
    return kOk;
}

void VerbSession::setPasswordFromFile(const PasswordRecord& password) {
    m_filePassword = password;
    if (m_terminal) m_terminal->setPasswordFromFile(password);
}

Result VerbSession::openArchive(Vaultora& archive) {
    Header header;
    const bool isArchive = probeArchiveHeader(archive.path(), header);
    if (!isArchive || headerHasNoKeyBlocks(header)) {
        // Not an archive (the open says why) or one that is not encrypted: no password to ask.
        return archive.open(OpenKey{});
    }
    if (!m_filePassword) return archive.openWithPassword();
    Result rc = archive.open(OpenKey{&*m_filePassword});
    if (rc == kWrongPassword || rc == kNotApplicable || rc == kKeyBlock39) {
        archive.file().close();
        ui().message(msgText(Msg::kPasswordInvalid), msgText(Msg::kCaptionError), mb::kOk | mb::kIconWarning);
        return kWrongPassword;
    }
    return rc;
}

Result VerbSession::createArchive(Vaultora& archive) {
    KeyBlockParams params;
    std::optional<std::vector<uint8_t>> stored = Settings::instance().readBinary("PrefKBParams");
    (void)DecodeKeyBlockParams(stored ? stored->data() : nullptr, stored ? stored->size() : 0, params);
    // Public-key recipients come from -PKID; without them a new archive is protected by a password.
    params.method = kMethodPassword;
    PasswordRecord pw;
    if (params.archiveAlg != 0) {
        if (!archive.ui().password(fromUtf8(archive.path()), pw, true)) return kCancelled;
    }
    return createWithPassword(archive, params, pw);
}

}  // namespace vaultora
