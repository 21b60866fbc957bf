#pragma once
// What every command-line verb shares for one run: who answers questions (the batch log when -LF
// or -LV is given, else the controlling terminal, else nobody: default answers), the password
// given from VAULTORA_PASSWORD_FILE, and opening or creating an archive with a password.
#include <memory>
#include <optional>
#include <string>

#include "app/batch_log.h"
#include "app/cmdline.h"
#include "app/terminal_interaction.h"
#include "archive/vaultora.h"

namespace vaultora {

class VerbSession {
public:
    // The run's own interaction: the terminal, under the batch log when one is set.
    explicit VerbSession(const BatchSettings& batch);
    // Every question goes to `ui` (tests); the batch log of `batch` is still written by the verbs.
    VerbSession(const BatchSettings& batch, Interaction& ui);
    VerbSession(const VerbSession&) = delete;
    VerbSession& operator=(const VerbSession&) = delete;

    // Reads the password file named by VAULTORA_PASSWORD_FILE, when it is set. A file that cannot
    // be read is reported and gives kCannotOpen.
    [[nodiscard]] Result loadPasswordFile();
    void setPasswordFromFile(const PasswordRecord& password);
    bool hasPasswordFile() const { return m_filePassword.has_value(); }

    // The batch-aware interaction (log, else terminal).
    Interaction& ui() { return *m_ui; }
    // The interaction without the log: where a failure of the log itself is shown.
    Interaction& plainUi() { return *m_plain; }
    // The batch log, or null in interactive use.
    BatchLog* log() { return m_log.get(); }
    const BatchSettings& batch() const { return m_batch; }

    // Opens an existing archive. One without key blocks opens without a password; with the
    // password file its password is tried once (a refused one is reported and gives 51); otherwise
    // the password is asked until it is right or the user cancels (83).
    [[nodiscard]] Result openArchive(Vaultora& archive);
    // Creates the archive protected by a new password (asked twice, or the password file), with
    // the key block parameters stored in "PrefKBParams" (defaults when there are none).
    [[nodiscard]] Result createArchive(Vaultora& archive);

private:
    BatchSettings m_batch;
    std::unique_ptr<TerminalInteraction> m_terminal;
    std::unique_ptr<BatchLog> m_log;
    std::unique_ptr<BatchLogInteraction> m_logUi;
    Interaction* m_ui = nullptr;
    Interaction* m_plain = nullptr;
    std::optional<PasswordRecord> m_filePassword;
};

}  // namespace vaultora
