#pragma once
// The archive object: one open archive file with its header, cluster table, record cipher,
// directory cache and temporary folder of crash copies.
#include <array>
#include <map>
#include <cstdint>
#include <string>
#include <vector>

#include "archive/dir_cache.h"
#include "archive/format.h"
#include "crypto/sym_alg.h"
#include "platform/file.h"
#include "platform/interaction.h"
#include "platform/result.h"
#include "platform/secure.h"

namespace vaultora {

class Vaultora;

// What opens an archive: a password, later also public-key material.
struct OpenKey {
    const PasswordRecord* password = nullptr;
};

// Functions of the layers above that the archive object calls: the full compaction (which is also
// the commit) and the recovery offered when no cluster table can be loaded. When not set, the
// archive commits with its own commitTail and offers no recovery.
struct ArchiveHooks {
    Result (*compact)(Vaultora& archive, bool force) = nullptr;
    Result (*offerRecovery)(Vaultora& archive, Result loadResult) = nullptr;
};
void setArchiveHooks(const ArchiveHooks& hooks);
const ArchiveHooks& archiveHooks();

class Vaultora {
public:
    // `path` is the archive's file path; `ui` answers questions and takes progress (a default
    // implementation that answers every question with its default answer is used when null).
    explicit Vaultora(std::string path, Interaction* ui = nullptr);
    ~Vaultora();
    Vaultora(const Vaultora&) = delete;
    Vaultora& operator=(const Vaultora&) = delete;

    // Opening.
    [[nodiscard]] Result openFile(bool readOnly);
    [[nodiscard]] Result open(const OpenKey& key);
    // Asks for the password until it opens the archive or the user cancels (83).
    [[nodiscard]] Result openWithPassword();
    [[nodiscard]] Result loadClusterTable();
    // Commits when modified, then releases everything; the crash copies and the temporary folder
    // go when the commit succeeded. Returns the commit's result.
    Result close();

    // Creation. With a master key block the cipher must already be set (setRecordCipher).
    [[nodiscard]] Result create(const uint8_t* masterBlock, size_t masterLength);

    // Cluster access.
    [[nodiscard]] Result readCluster(ChainBuffer& buffer);
    // Reads the stored record of c into `record` (resized to the record length).
    [[nodiscard]] Result readRecord(uint32_t c, std::vector<uint8_t>& record);
    [[nodiscard]] Result writeDataCluster(uint32_t c, const uint8_t* payload, uint32_t n, bool saveTable);
    [[nodiscard]] Result writeDirectoryCluster(ChainBuffer& buffer, bool throughCache);
    [[nodiscard]] Result moveClusterFile(uint32_t c);
    // Moves every cluster file into the archive, appending from `dataEnd`, which is updated.
    [[nodiscard]] Result moveAllClusterFiles(uint64_t& dataEnd);

    // Cluster table.
    uint32_t allocateCluster(uint32_t hint);
    [[nodiscard]] Result appendCluster(uint32_t chainStart, uint32_t& added);
    // Frees a chain. Until the directories that named it have been written (the next directory
    // write or flush calls applyPendingFrees), the saved table keeps its clusters in use and
    // allocation passes them over.
    bool freeChain(uint32_t start);
    void applyPendingFrees();
    uint32_t nextCluster(uint32_t c) const;
    uint32_t previousCluster(uint32_t c) const;
    std::vector<uint32_t> chainClusters(uint32_t start) const;
    uint64_t computeDataEnd() const;
    [[nodiscard]] Result saveClusterTable();
    [[nodiscard]] Result saveClusterTable(uint64_t position);
    [[nodiscard]] Result saveHeader(cSymAlg* cipher = nullptr);

    // Key blocks (opaque bytes here).
    [[nodiscard]] Result readMasterKeyBlock(SecureBytes& block);
    bool readExtendedKeyBlock(SecureBytes& block);
    bool writeExtendedKeyBlock(const SecureBytes& block);
    // Overwrites the master key block in place (same length) behind a crash copy.
    [[nodiscard]] Result writeMasterKeyBlock(const SecureBytes& block);
    void backupExtendedKeyBlock();

    // Batch mode: directory clusters stay in the cache, the table is saved when the batch ends.
    bool setBatch(bool on);
    [[nodiscard]] Result flushDirectoryCache();

    // The commit without the compaction front: move cluster files in, write the table at the data
    // end, rewrite the extended key block behind it, mark clean.
    [[nodiscard]] Result commitTail();

    // Utilities.
    bool ensureTemporaryFolder();
    void showError(std::u16string_view text);
    void showErrorNumber(Result code);
    // Records "Error %d, File %s, line %d" and returns the code unchanged.
    Result errorNote(Result code, const char* module, int line);
    static std::u16string formatFileTime(uint64_t filetime);

    // State.
    bool isOpen() const { return m_file.isOpen(); }
    bool isReadOnly() const { return m_readOnly; }
    bool isModified() const { return m_modified; }
    bool isClean() const { return m_clean; }
    bool isBatch() const { return m_batch; }
    const Header& header() const { return m_header; }
    Header& mutableHeader() { return m_header; }
    const std::vector<CotEntry>& cot() const { return m_cot; }
    std::vector<CotEntry>& mutableCot() { return m_cot; }
    uint64_t dataEnd() const { return m_dataEnd; }
    void setDataEnd(uint64_t v) { m_dataEnd = v; }
    uint32_t blockSize() const { return m_header.blockSize; }
    uint64_t dataStart() const { return static_cast<uint64_t>(m_header.embeddedOffset) + m_header.dataOffset; }
    ClusterCipher& recordCipher() { return m_cipher; }
    void setRecordCipher(uint8_t cipherId, SecureBytes key, ClusterCipher cipher);
    uint8_t cipherId() const { return m_cipherId; }
    const SecureBytes& archiveKey() const { return m_archiveKey; }
    const std::string& path() const { return m_path; }
    const std::string& temporaryFolder() const { return m_tempFolder; }
    std::string crashPath(const char* name) const { return m_tempFolder + name; }
    std::string clusterFilePath(uint32_t c, const char* ext = "CLS") const;
    File& file() { return m_file; }
    Interaction& ui() { return *m_ui; }
    void setInteraction(Interaction* ui);
    std::u16string* collectedMessages = nullptr;
    const uint32_t* pCancelFlag = nullptr;
    bool cancelled() const { return pCancelFlag != nullptr && *pCancelFlag != 0; }
    bool compactWhenUpdated() const { return m_compactWhenUpdated; }
    void setCompactWhenUpdated(bool on) { m_compactWhenUpdated = on; }
    uint32_t mailDeleteDelay() const { return m_mailDelay; }
    // Marks the archive modified; the first time it also backs up the extended key block and
    // saves a copy of the table so the archive's own table may be overwritten.
    [[nodiscard]] Result markModified();
    // Writes an encoded record at the data end by the placement rule; returns its offset.
    [[nodiscard]] Result appendRecord(const std::vector<uint8_t>& record, uint64_t& offset);
    // Reads ~Cluster.dat back and appends its record (resume of an interrupted move).
    [[nodiscard]] Result restoreClusterCopy();
    // Writes (cluster, record) to ~Cluster.dat before a record is moved; deleteClusterCopy after.
    [[nodiscard]] Result writeClusterCopy(uint32_t c, const std::vector<uint8_t>& record);
    void deleteClusterCopy();

private:
    void buildCrashPaths(bool& cancelled);
    Result adoptHeaderCopy();
    Result readClusterFile(uint32_t c, std::vector<uint8_t>& record);
    Result writeClusterFile(uint32_t c, const SecureBytes& payload);
    Result encodeCluster(uint32_t c, const uint8_t* payload, uint32_t n, std::vector<uint8_t>& record);
    Result writeCotCopy(const std::vector<uint8_t>& record);
    Result saveTableNow();  // saves the table even in batch mode
    std::vector<CotEntry> tableToSave() const;
    Result loadCotFrom(const std::string& path);
    Result computeHeaderCheck(cSymAlg* cipher, std::array<uint8_t, 20>& out) const;
    void repairInterruptedClusterFiles();
    Result finishLeftoverFolder();
    void deletePendingClusterFiles();
    void writeBackMasterKeyCopy();

    std::string m_path;
    std::string m_tempFolder;  // ends with '/'
    Interaction* m_ui;
    Header m_header;
    File m_file;
    bool m_readOnly = false;
    uint64_t m_dataEnd = 0;
    uint8_t m_cipherId = 0;
    SecureBytes m_archiveKey;
    ClusterCipher m_cipher;
    std::vector<CotEntry> m_cot;
    std::vector<uint8_t> m_storedCot;  // the table record as the archive holds it
    DirectoryCache m_cache;
    bool m_crashPathsBuilt = false;
    bool m_useMasterKeyCopy = false;
    SecureBytes m_masterKeyCopy;
    bool m_clean = false;
    bool m_batch = false;
    bool m_modified = false;
    bool m_compactWhenUpdated = true;
    bool m_compactFlagRead = true;  // as read from the settings, to write back only a change
    uint32_t m_mailDelay = 0;
    std::vector<uint32_t> m_pendingClusterFileDeletes;
    std::map<uint32_t, CotEntry> m_pendingFrees;  // freed clusters with their entries as last saved
    std::vector<uint8_t> m_savedCotCopy;  // what ~COT.dat holds, to skip saving the same table
};

}  // namespace vaultora
