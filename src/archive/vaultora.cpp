// The archive object.
//
// NOTES ON CRASH SAFETY
//
// Every change goes first into the temporary folder "<archive>.vrt/" beside the archive, so that a
// run stopped at any point (a crash, a kill, a full disk) leaves an archive that the next open
// either resumes or repairs. The rules that make this hold:
//
// (1) The archive's own table is never overwritten while it is the only copy. The first change
//     (markModified) saves ~COT.dat before anything is appended at the data end, which starts on
//     top of the old table record.
// (2) Data clusters are only ever appended behind the data end, never written in place, and a
//     freed cluster's stored record stays where it is until the table that no longer needs it has
//     been saved; cluster files of freed clusters are deleted only after that save
//     (deletePendingClusterFiles).
// (3) ~COT.dat is replaced in two steps: the previous copy goes to ~COTCopy.dat first, then
//     ~COT.dat is rewritten and synced (writeCotCopy). At open the first of the two that decodes
//     wins (loadClusterTable).
// (4) A directory cluster file CN%04X.CLS is replaced by renaming the old one to .REN, writing the
//     new one, then deleting the .REN. An open that finds a .REN puts it back unless the .CLS
//     beside it is complete (repairInterruptedClusterFiles).
// (5) Batch mode saves the table before the cached directory clusters are written out, so that a
//     directory never names clusters that the saved table calls free (setBatch).
// (6) The header is written behind ~Signature.dat (saveHeader); an open adopts a leftover copy
//     and writes it into the archive before deleting it (adoptHeaderCopy).
// (7) The extended key block is written to ~PKEncSessKeysPkt.dat before the archive's copy is
//     touched, and the master key block to ~MasterKeyPkt.dat before it is overwritten.
// (8) Commit (commitTail): cluster files are appended to the archive one by one with a table save
//     after each, then the table is written at the data end (the file is cut there), read back
//     and compared, the header is pointed at it, the extended key block follows; only then is the
//     archive clean and the temporary folder removed at close.
//
// States: closed -> openFile -> open (clean) -> first write: modified (table in ~COT.dat,
// directory clusters in cluster files, data appended) -> commitTail: clean -> close: crash copies
// and temporary folder deleted.
#include "archive/vaultora.h"

#include <time.h>

#include <algorithm>
#include <cstring>
#include <ctime>

#include "crypto/key_block.h"
#include "platform/messages.h"
#include "platform/settings.h"
#include "platform/text.h"

namespace vaultora {

namespace {

ArchiveHooks g_hooks;

constexpr const char* kCotFile = "~COT.dat";
constexpr uint64_t kMaxExtendedKeyBlock = 16u << 20;
constexpr const char* kCotCopyFile = "~COTCopy.dat";
constexpr const char* kSignatureFile = "~Signature.dat";
constexpr const char* kClusterCopyFile = "~Cluster.dat";
constexpr const char* kExtendedCopyFile = "~PKEncSessKeysPkt.dat";
constexpr const char* kMasterCopyFile = "~MasterKeyPkt.dat";

bool endsWithIgnoreCase(const std::string& s, const char* suffix) {
    size_t n = std::strlen(suffix);
    return s.size() >= n && equalsIgnoreCaseAscii(std::string_view(s).substr(s.size() - n), suffix);
}

}  // namespace

void setArchiveHooks(const ArchiveHooks& hooks) { g_hooks = hooks; }
const ArchiveHooks& archiveHooks() { return g_hooks; }

Vaultora::Vaultora(std::string path, Interaction* ui)
    : m_path(std::move(path)), m_ui(ui != nullptr ? ui : &DefaultInteraction::instance()) {
    m_tempFolder = m_path + ".vrt/";
    m_compactWhenUpdated = appFlag(appflag::kDynamicCompact);
    m_compactFlagRead = m_compactWhenUpdated;
    m_mailDelay = sendMailDelayBeforeDeleteTempFile();
}

Vaultora::~Vaultora() { close(); }

void Vaultora::setInteraction(Interaction* ui) { m_ui = ui != nullptr ? ui : &DefaultInteraction::instance(); }

std::string Vaultora::clusterFilePath(uint32_t c, const char* ext) const {
    char name[32];
    std::snprintf(name, sizeof name, "CN%04X.%s", c, ext);
    return m_tempFolder + name;
}

void Vaultora::setRecordCipher(uint8_t cipherId, SecureBytes key, ClusterCipher cipher) {
    m_cipherId = cipherId;
    m_archiveKey = std::move(key);
    m_cipher = std::move(cipher);
}

Result Vaultora::errorNote(Result code, const char* module, int line) {
    std::u16string text = msgFormat(Msg::kErrorNote, {static_cast<unsigned>(code), module, line});
    if (!m_ui->logError(text) && collectedMessages != nullptr) {
        collectedMessages->append(text);
        collectedMessages->push_back(u'\n');
    }
    return code;
}

void Vaultora::showError(std::u16string_view text) {
    m_ui->message(text, msgText(Msg::kCaptionError), mb::kOk | mb::kIconError);
}

void Vaultora::showErrorNumber(Result code) { showError(msgFormat(Msg::kErrorNumber, {static_cast<unsigned>(code)})); }

std::u16string Vaultora::formatFileTime(uint64_t filetime) {
    constexpr uint64_t kEpochDelta = 116444736000000000ull;
    if (filetime < kEpochDelta) return std::u16string(msgText(Msg::kInvalidTime));
    time_t t = static_cast<time_t>((filetime - kEpochDelta) / 10000000ull);
    struct tm tmv {};
    if (localtime_r(&t, &tmv) == nullptr) return std::u16string(msgText(Msg::kInvalidTime));
    char buf[64];
    if (std::strftime(buf, sizeof buf, "%x %H:%M", &tmv) == 0) return std::u16string(msgText(Msg::kInvalidTime));
    return fromUtf8(buf);
}

bool Vaultora::ensureTemporaryFolder() {
    std::string folder = m_tempFolder.substr(0, m_tempFolder.size() - 1);
    if (fs::createDirectories(folder, 0700)) return true;
    int err = errno;
    m_ui->message(msgFormat(Msg::kErrorCreatingDirectory, {fs::errorText(err), folder}),
                  msgText(Msg::kCaptionAttention), mb::kOk | mb::kIconError);
    return false;
}

// ---------------------------------------------------------------------------------------------
// Opening

void Vaultora::buildCrashPaths(bool& cancelled) {
    cancelled = false;
    if (m_crashPathsBuilt) return;
    m_crashPathsBuilt = true;
    const std::string copy = crashPath(kMasterCopyFile);
    if (!fs::exists(copy)) return;
    int answer = m_ui->message(msgText(Msg::kMasterKeyCopyExists), msgText(Msg::kCaptionAttention), mb::kYesNoCancel);
    if (answer == kAnswerCancel) {
        m_crashPathsBuilt = false;  // ask again at the next open
        cancelled = true;
    } else if (answer == kAnswerYes) {
        std::vector<uint8_t> bytes;
        if (fs::readWholeFile(copy, bytes)) {
            m_masterKeyCopy.assign(bytes.begin(), bytes.end());
            secureWipe(bytes.data(), bytes.size());
            m_useMasterKeyCopy = true;
        }
    }
}

Result Vaultora::openFile(bool readOnly) {
    m_file.close();
    if (!fs::exists(m_path)) return kNoSuchFile;
    int err = m_file.open(m_path, readOnly ? OpenMode::kRead : OpenMode::kReadWrite, true);
    if (err != 0) return err == kSharingViolation ? kInUse : kCannotOpen;
    m_readOnly = readOnly;
    bool cancelled = false;
    buildCrashPaths(cancelled);
    if (cancelled) {
        m_file.close();
        return kCancelled;
    }
    std::array<uint8_t, 68> image{};
    Header found;
    auto reader = [this](uint64_t off, uint8_t* buf, size_t n) { return m_file.readAt(off, buf, n); };
    if (!findHeader(reader, m_header.embeddedOffset, found, image)) {
        // The remembered offset may be stale (a new object starts at 0): search from the start.
        if (m_header.embeddedOffset == 0 || !findHeader(reader, 0, found, image)) {
            m_file.close();
            return kNotArchive;
        }
    }
    m_header = found;
    (void)adoptHeaderCopy();
    if (!m_header.versionSupported()) {
        m_file.close();
        return kNewerFormat;
    }
    return kOk;
}

Result Vaultora::adoptHeaderCopy() {
    const std::string copy = crashPath(kSignatureFile);
    if (!fs::exists(copy)) return kOk;
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(copy, bytes) || bytes.size() != m_header.size() || std::memcmp(bytes.data(), kMagic, 16) != 0) {
        // A copy that was not completely written: the archive's header was never touched.
        fs::removeFile(copy);
        return kReadFailed;
    }
    bytes.resize(68, 0);
    uint32_t embedded = m_header.embeddedOffset;
    m_header = Header::decode(bytes.data());
    m_header.embeddedOffset = embedded;
    if (m_readOnly) return kOk;  // keep the copy until the archive can be written
    std::array<uint8_t, 68> image = m_header.encode();
    if (m_file.writeAt(embedded, image.data(), m_header.size()) && m_file.sync()) fs::removeFile(copy);
    return kOk;
}

Result Vaultora::open(const OpenKey& key) {
    Result rc = openFile(false);
    if (rc == kCannotOpen || rc == kInUse) rc = openFile(true);
    if (rc != kOk) return rc;

    SecureBytes blocks;
    if (Result r = readMasterKeyBlock(blocks); r != kOk) return r;
    const size_t masterLength = blocks.size();
    if (m_header.hasExtendedBlock()) {
        SecureBytes ext;
        if (!readExtendedKeyBlock(ext)) {
            m_ui->message(msgFormat(Msg::kExtendedKeyBlockCorrupted, {m_path}), msgText(Msg::kCaptionError),
                          mb::kOk | mb::kIconWarning);
        } else {
            blocks.insert(blocks.end(), ext.begin(), ext.end());
        }
    }

    if (blocks.empty()) {
        // No key blocks: the archive is not encrypted; its header still carries a plain check.
        setRecordCipher(0, {}, ClusterCipher());
        std::array<uint8_t, 20> check{};
        if (Result r = computeHeaderCheck(nullptr, check); r != kOk) return r;
        if (check != m_header.headerCheck) return kWrongPassword;
    } else {
        KeyMaterial material;
        material.password = key.password;
        const std::array<uint8_t, 68> image = m_header.encode();
        ArchiveKey found;
        rc = OpenKeyBlocks(blocks.data(), blocks.size(), masterLength, material, image.data(), false, found);
        if (rc == kWrongPassword || rc == kNotApplicable || rc == kKeyBlock39)
            rc = OpenKeyBlocks(blocks.data(), blocks.size(), masterLength, material, image.data(), true, found);
        if (rc != kOk) return rc;
        if (found.cipher != nullptr && found.cipher->blockSize() > m_header.blockSize) return kInconsistent;
        setRecordCipher(found.cipherId, std::move(found.key), ClusterCipher(std::move(found.cipher)));
    }

    rc = loadClusterTable();
    if (rc != kOk && m_header.versionMajor >= 2 && g_hooks.offerRecovery != nullptr)
        return g_hooks.offerRecovery(*this, rc);
    return rc;
}

Result Vaultora::openWithPassword() {
    for (;;) {
        PasswordRecord pw;
        if (!m_ui->password(fromUtf8(m_path), pw, false)) return kCancelled;
        OpenKey key;
        key.password = &pw;
        Result rc = open(key);
        if (rc != kWrongPassword && rc != kNotApplicable && rc != kKeyBlock39) return rc;
        m_file.close();
        m_ui->passwordRejected();
        m_ui->message(msgText(Msg::kPasswordInvalid), msgText(Msg::kCaptionError), mb::kOk | mb::kIconWarning);
    }
}

Result Vaultora::loadCotFrom(const std::string& path) {
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(path, bytes)) return kReadFailed;
    std::vector<CotEntry> table;
    Result rc = decodeCotRecord(bytes.data(), bytes.size(), blockSize(), m_cipher, table);
    if (rc == kOk) m_cot = std::move(table);
    return rc;
}

Result Vaultora::loadClusterTable() {
    if (fs::isDirectory(m_tempFolder)) {
        repairInterruptedClusterFiles();
        Result rc = loadCotFrom(crashPath(kCotFile));
        if (rc != kOk) rc = loadCotFrom(crashPath(kCotCopyFile));
        if (rc == kOk) {
            backupExtendedKeyBlock();
            m_header.cotOffset = kCotNotStored;
            m_modified = true;
            m_clean = false;
            m_dataEnd = computeDataEnd();
            (void)restoreClusterCopy();
            return kOk;
        }
    }
    if (m_header.cotOffset == kCotNotStored) return kBadRecord;
    const uint64_t pos = dataStart() + m_header.cotOffset;
    const int64_t fileSize = m_file.size();
    if (fileSize < 0 || pos > static_cast<uint64_t>(fileSize)) return errorNote(kInconsistent, "HXZip", __LINE__);
    const uint64_t available = static_cast<uint64_t>(fileSize) - pos;
    if (available > 0xFFFFFFFFull || available < m_header.cotLength || m_header.cotLength == 0)
        return errorNote(kInconsistent, "HXZip", __LINE__);
    std::vector<uint8_t> record(m_header.cotLength);
    if (!m_file.readExact(pos, record.data(), record.size())) return kReadFailed;
    std::vector<CotEntry> table;
    Result rc = decodeCotRecord(record.data(), record.size(), blockSize(), m_cipher, table);
    if (rc != kOk) return rc == kInconsistent ? errorNote(rc, "HXZip", __LINE__) : rc;
    m_cot = std::move(table);
    m_storedCot = std::move(record);
    m_dataEnd = m_header.cotOffset;
    if (!m_readOnly && fs::isDirectory(m_tempFolder)) return finishLeftoverFolder();
    return kOk;
}

Result Vaultora::finishLeftoverFolder() {
    // The archive's own table was used, so nothing in the temporary folder belongs to it except a
    // key block copy: cluster files and table copies there are what an interrupted run left
    // before it saved any table.
    for (const std::string& n : fs::listDirectory(m_tempFolder.substr(0, m_tempFolder.size() - 1))) {
        if (n == kMasterCopyFile || n == kExtendedCopyFile) continue;
        fs::removeTree(m_tempFolder + n);
    }
    // A newer extended key block waits in its copy: the commit at close writes it.
    if (fs::exists(crashPath(kExtendedCopyFile))) return markModified();
    if (!fs::exists(crashPath(kMasterCopyFile))) fs::removeTree(m_tempFolder.substr(0, m_tempFolder.size() - 1));
    return kOk;
}

void Vaultora::repairInterruptedClusterFiles() {
    // A CN%04X.REN is the previous version of a directory cluster file whose rewrite was cut
    // short: it goes back into place unless the new file beside it is complete.
    std::vector<uint8_t> bytes;
    for (const std::string& n : fs::listDirectory(m_tempFolder.substr(0, m_tempFolder.size() - 1))) {
        if (n.size() <= 6 || n.compare(0, 2, "CN") != 0 || n.compare(n.size() - 4, 4, ".REN") != 0) continue;
        const std::string ren = m_tempFolder + n;
        const std::string cls = m_tempFolder + n.substr(0, n.size() - 4) + ".CLS";
        const bool complete = fs::readWholeFile(cls, bytes) && bytes.size() >= 6 && bytes[0] == 'H' &&
                              bytes[1] == 'X' && getU32(bytes.data() + 2) + 6ull == bytes.size();
        if (complete) fs::removeFile(ren);
        else fs::renameFile(ren, cls);
    }
}

// ---------------------------------------------------------------------------------------------
// Closing

void Vaultora::writeBackMasterKeyCopy() {
    if (!m_useMasterKeyCopy || m_masterKeyCopy.empty() || m_readOnly || !m_file.isOpen()) return;
    int answer = m_ui->message(msgText(Msg::kWriteMasterKeyBack), msgText(Msg::kCaptionVaultora),
                               mb::kYesNo | mb::kIconQuestion);
    if (answer != kAnswerYes) return;
    (void)writeMasterKeyBlock(m_masterKeyCopy);
}

Result Vaultora::close() {
    Result result = kOk;
    if (m_file.isOpen()) {
        if (m_modified && !m_readOnly) {
            result = g_hooks.compact != nullptr ? g_hooks.compact(*this, true) : commitTail();
        }
        m_cache.clear();
        writeBackMasterKeyCopy();
        m_file.close();
        if (m_clean) {
            for (const char* n : {kCotFile, kCotCopyFile, kSignatureFile, kClusterCopyFile, kExtendedCopyFile})
                fs::removeFile(crashPath(n));
            fs::removeTree(m_tempFolder.substr(0, m_tempFolder.size() - 1));
        }
    }
    m_cache.clear();
    m_cot.clear();
    m_storedCot.clear();
    m_masterKeyCopy.clear();
    m_useMasterKeyCopy = false;
    m_crashPathsBuilt = false;
    m_modified = false;
    m_clean = false;
    m_batch = false;
    m_cache.setWriteBack(false);
    m_pendingClusterFileDeletes.clear();
    m_pendingFrees.clear();
    m_savedCotCopy.clear();
    // The archive key and its cipher schedule are wiped as they are released.
    m_archiveKey.clear();
    m_archiveKey.shrink_to_fit();
    m_cipher = ClusterCipher();
    m_cipherId = 0;
    if (m_compactWhenUpdated != m_compactFlagRead && setAppFlag(appflag::kDynamicCompact, m_compactWhenUpdated))
        m_compactFlagRead = m_compactWhenUpdated;
    return result;
}

// ---------------------------------------------------------------------------------------------
// Creation

Result Vaultora::create(const uint8_t* masterBlock, size_t masterLength) {
    // The cipher set up for the new archive survives the reset of close().
    const uint8_t cipherId = m_cipherId;
    SecureBytes key = std::move(m_archiveKey);
    ClusterCipher cipher = std::move(m_cipher);
    close();
    setRecordCipher(cipherId, std::move(key), std::move(cipher));
    m_header = Header{};
    uint32_t b = m_cipher.hasCipher() ? m_cipher.blockSize() : 8;
    m_header.blockSize = static_cast<uint8_t>(std::max<uint32_t>(b, 8));
    m_header.masterKeyOffset = kHeaderSize21;
    m_header.dataOffset = static_cast<uint32_t>(kHeaderSize21 + masterLength);
    m_header.cotOffset = kCotNotStored;
    m_header.embeddedOffset = 0;

    uint64_t position = 0;
    int err = 0;
    if (endsWithIgnoreCase(m_path, ".exe")) {
        // A self-extracting archive: the extractor program first, the archive behind it.
        const std::string stub = "";  // the self-extractor base is not built yet
        if (stub.empty() || !fs::exists(stub)) return kCannotOpen;
        if (!fs::copyFile(stub, m_path)) return kWriteFailed;
        err = m_file.open(m_path, OpenMode::kOpenAlways, true);
        if (err == 0) position = static_cast<uint64_t>(std::max<int64_t>(m_file.size(), 0));
    } else {
        err = m_file.open(m_path, OpenMode::kCreateNew, true);
    }
    if (err != 0) return kCannotOpen;
    m_readOnly = false;
    m_crashPathsBuilt = true;
    m_header.embeddedOffset = static_cast<uint32_t>(position);

    std::array<uint8_t, 20> check{};
    if (Result rc = computeHeaderCheck(nullptr, check); rc != kOk) return rc;
    m_header.headerCheck = check;
    std::array<uint8_t, 68> image = m_header.encode();
    if (!m_file.writeAt(position, image.data(), m_header.size())) return kWriteFailed;
    if (!m_file.truncate(position + m_header.size())) return kWriteFailed;
    if (masterLength != 0 && !m_file.writeAt(position + m_header.masterKeyOffset, masterBlock, masterLength))
        return kWriteFailed;
    m_dataEnd = 0;

    // The root directory: cluster 0 holding only the volume record.
    m_cot.clear();
    growTable(m_cot, 0);
    m_cot[0] = CotEntry{kEndOfChain, 0, 0};
    ChainBuffer root;
    root.cluster = 0;
    std::vector<uint8_t> volume = unit::volumeRecord();
    root.data.assign(volume.begin(), volume.end());
    root.dirty = true;
    return writeDirectoryCluster(root, true);
}

Result Vaultora::computeHeaderCheck(cSymAlg* cipher, std::array<uint8_t, 20>& out) const {
    const std::array<uint8_t, 68> image = m_header.encode();
    cSymAlg* alg = cipher != nullptr ? cipher : m_cipher.alg();
    return ComputeHeaderCheck(image.data(), alg, out.data());
}

// ---------------------------------------------------------------------------------------------
// Cluster access

Result Vaultora::readCluster(ChainBuffer& buffer) {
    buffer.reset();
    const uint32_t c = buffer.cluster;
    if (m_cache.lookup(c, buffer.data)) return kOk;
    if (c >= m_cot.size() || m_cot[c].next == 0) {
        int answer = m_ui->message(msgFormat(Msg::kClusterLost, {c, static_cast<unsigned>(m_cot.size())}),
                                   msgText(Msg::kCaptionVaultora), mb::kYesNo | mb::kIconWarning);
        if (answer == kAnswerYes) return kOk;
        return errorNote(kInconsistent, "HXZip", __LINE__);
    }
    const CotEntry& e = m_cot[c];
    if (e.size == 0) return kOk;
    std::vector<uint8_t> record;
    if (Result rc = readRecord(c, record); rc != kOk) return rc;
    Result rc = decodeClusterRecord(m_header.isFormat2(), record.data(), record.size(), c,
                                    e.inClusterFile() ? 0 : e.size, blockSize(), m_cipher, buffer.data);
    if (rc == kCompression && m_header.isFormat2()) errorNote(rc, "HXZip", __LINE__);
    return rc;
}

Result Vaultora::readRecord(uint32_t c, std::vector<uint8_t>& record) {
    if (c >= m_cot.size()) return kInconsistent;
    const CotEntry& e = m_cot[c];
    if (e.inClusterFile()) return readClusterFile(c, record);
    record.resize(e.size);
    const uint64_t pos = dataStart() + e.offset;
    const int64_t fileSize = m_file.size();
    if (fileSize < 0 || pos + e.size > static_cast<uint64_t>(fileSize)) {
        if (fileSize >= 0 && pos > static_cast<uint64_t>(fileSize)) {
            m_ui->message(msgFormat(Msg::kSeekErrorDetail, {c, static_cast<unsigned>(pos >> 32),
                                                            static_cast<unsigned>(pos & 0xFFFFFFFF), m_path}),
                          msgText(Msg::kErrorSettingFilePointer), mb::kOk | mb::kIconError);
            return kSeekFailed;
        }
        return kReadFailed;
    }
    if (!m_file.readExact(pos, record.data(), e.size)) return kReadFailed;
    return kOk;
}

Result Vaultora::readClusterFile(uint32_t c, std::vector<uint8_t>& record) {
    File f;
    if (f.open(clusterFilePath(c), OpenMode::kRead) != 0) return kReadFailed;
    int64_t size = f.size();
    uint8_t head[6];
    if (size < 6 || !f.readExact(0, head, 6)) return kReadFailed;
    if (head[0] != 'H' || head[1] != 'X') return kInconsistent;
    const uint32_t n = getU32(head + 2);
    if (static_cast<uint64_t>(n) + 6 != static_cast<uint64_t>(size)) return kInconsistent;
    const CotEntry& e = m_cot[c];
    if (!e.inClusterFile() && n != e.size) return kInconsistent;
    record.resize(n);
    if (!f.readExact(6, record.data(), n)) return kReadFailed;
    return kOk;
}

Result Vaultora::encodeCluster(uint32_t c, const uint8_t* payload, uint32_t n, std::vector<uint8_t>& record) {
    const uint32_t next = c < m_cot.size() ? m_cot[c].next : kEndOfChain;
    return encodeClusterRecord(m_header.isFormat2(), payload, n, c, next, blockSize(), m_cipher, record);
}

Result Vaultora::appendRecord(const std::vector<uint8_t>& record, uint64_t& offset) {
    const uint64_t size = record.size();
    uint64_t at = m_dataEnd;
    const uint64_t boundary = (at / kSpaceUnit + 1) * kSpaceUnit;
    if (at + size > boundary) at = boundary;
    if (!m_file.writeAt(dataStart() + at, record.data(), record.size())) return kClusterWriteFailed;
    offset = at;
    m_dataEnd = at + size;
    return kOk;
}

Result Vaultora::markModified() {
    if (m_modified) return kOk;
    if (m_readOnly) return kCannotOpen;
    if (!ensureTemporaryFolder()) return kTempFolder;
    backupExtendedKeyBlock();
    m_modified = true;
    m_clean = false;
    // Keep the table that the archive holds now, as it was stored (clusters allocated since are
    // not in it): what is written next lands on top of it.
    if (!fs::exists(crashPath(kCotFile))) {
        std::vector<uint8_t> record = m_storedCot;
        if (record.empty()) {
            if (Result rc = encodeCotRecord(m_cot, blockSize(), m_cipher, record); rc != kOk) return rc;
        }
        if (Result rc = writeCotCopy(record); rc != kOk) return rc;
    }
    return kOk;
}

Result Vaultora::writeDataCluster(uint32_t c, const uint8_t* payload, uint32_t n, bool saveTable) {
    if (blockSize() == 0 || m_header.dataOffset == 0) return kInconsistent;
    if (c >= m_cot.size()) return kInconsistent;
    if (Result rc = markModified(); rc != kOk) return rc;
    m_cache.drop(c);
    if (n == 0) {
        m_cot[c].size = 0;
        m_cot[c].offset = 0;
        return kOk;
    }
    std::vector<uint8_t> record;
    if (Result rc = encodeCluster(c, payload, n, record); rc != kOk) return rc;
    uint64_t offset = 0;
    if (Result rc = appendRecord(record, offset); rc != kOk) return rc;
    m_cot[c].offset = offset;
    m_cot[c].size = static_cast<uint32_t>(record.size());
    if (saveTable) return saveClusterTable();
    return kOk;
}

Result Vaultora::writeClusterFile(uint32_t c, const SecureBytes& payload) {
    if (c >= m_cot.size()) return kInconsistent;
    std::vector<uint8_t> record;
    if (Result rc = encodeCluster(c, payload.data(), static_cast<uint32_t>(payload.size()), record); rc != kOk)
        return rc;
    const std::string cls = clusterFilePath(c);
    const std::string ren = clusterFilePath(c, "REN");
    const bool hadOld = fs::exists(cls);
    if (hadOld && !fs::renameFile(cls, ren)) return kWriteFailed;
    std::vector<uint8_t> file(6 + record.size());
    file[0] = 'H';
    file[1] = 'X';
    putU32(&file[2], static_cast<uint32_t>(record.size()));
    std::memcpy(file.data() + 6, record.data(), record.size());
    File f;
    if (f.open(cls, OpenMode::kCreateAlways) != 0 || !f.writeAt(0, file.data(), file.size())) {
        f.close();
        if (hadOld) fs::renameFile(ren, cls);
        return kWriteFailed;
    }
    f.close();
    m_cot[c].offset = kInClusterFile;
    m_cot[c].size = static_cast<uint32_t>(record.size());
    if (hadOld) fs::removeFile(ren);
    return kOk;
}

Result Vaultora::writeDirectoryCluster(ChainBuffer& buffer, bool throughCache) {
    const uint32_t c = buffer.cluster;
    if (c >= m_cot.size()) return kInconsistent;
    if (Result rc = markModified(); rc != kOk) return rc;
    if (buffer.data.empty()) {
        fs::removeFile(clusterFilePath(c));
        m_cot[c].offset = 0;
        m_cot[c].size = 0;
        m_cache.drop(c);
        buffer.dirty = false;
        return kOk;
    }
    if (throughCache) {
        // An evicted directory cluster goes to its file behind a table that names every cluster
        // it may refer to.
        auto writer = [this](uint32_t cl, const SecureBytes& data) {
            Result rc = saveTableNow();
            return rc != kOk ? rc : writeClusterFile(cl, data);
        };
        if (Result rc = m_cache.store(buffer, writer); rc != kOk) return rc;
        if (m_batch) return kOk;
    }
    if (Result rc = saveTableNow(); rc != kOk) return rc;
    if (Result rc = writeClusterFile(c, buffer.data); rc != kOk) return rc;
    buffer.dirty = false;
    applyPendingFrees();
    return saveClusterTable();
}

Result Vaultora::saveTableNow() {
    const bool batch = m_batch;
    m_batch = false;
    Result rc = saveClusterTable();
    m_batch = batch;
    return rc;
}

Result Vaultora::moveClusterFile(uint32_t c) {
    m_ui->progressStatus(msgFormat(Msg::kWritingClusterFile, {c}));
    std::vector<uint8_t> record;
    if (Result rc = readClusterFile(c, record); rc != kOk) return rc;
    uint64_t offset = 0;
    if (Result rc = appendRecord(record, offset); rc != kOk) return rc;
    m_cot[c].offset = offset;
    m_cot[c].size = static_cast<uint32_t>(record.size());
    if (Result rc = saveClusterTable(); rc != kOk) return rc;
    fs::removeFile(clusterFilePath(c));
    return kOk;
}

Result Vaultora::moveAllClusterFiles(uint64_t& dataEnd) {
    m_dataEnd = dataEnd;
    const size_t count = m_cot.size();
    for (size_t c = 0; c < count; ++c) {
        if (m_cot[c].used() && m_cot[c].inClusterFile()) {
            if (Result rc = moveClusterFile(static_cast<uint32_t>(c)); rc != kOk) return rc;
            m_ui->progressPercent(static_cast<int>(c * 100 / count));
        }
    }
    dataEnd = m_dataEnd;
    return kOk;
}

// ---------------------------------------------------------------------------------------------
// Cluster table

uint32_t Vaultora::allocateCluster(uint32_t hint) {
    uint32_t c = hint + 1;
    if (hint == kNoCluster || c == 0) c = 1;
    if (c >= m_cot.size()) growTable(m_cot, c);
    auto taken = [this](uint32_t i) { return m_cot[i].used() || m_pendingFrees.count(i) != 0; };
    if (c >= m_cot.size() || taken(c)) {
        c = 0;
        for (uint32_t i = 1;; ++i) {
            if (i >= m_cot.size()) {
                if (m_cot.size() >= 0xFFFFFFFEull) return kNoCluster;
                growTable(m_cot, i);
            }
            if (!taken(i)) { c = i; break; }
        }
    }
    m_cot[c] = CotEntry{kEndOfChain, 0, 0};
    return c;
}

Result Vaultora::appendCluster(uint32_t chainStart, uint32_t& added) {
    added = kNoCluster;
    std::vector<uint32_t> chain = chainClusters(chainStart);
    if (chain.empty()) return kInconsistent;
    uint32_t c = allocateCluster(kNoCluster);
    if (c == kNoCluster) return kNoFreeCluster;
    m_cot[chain.back()].next = c;
    added = c;
    return kOk;
}

bool Vaultora::freeChain(uint32_t start) {
    if (start == 0 || start == kNoCluster) return true;
    uint32_t c = start;
    size_t steps = 0;
    while (c != kEndOfChain) {
        if (c >= m_cot.size() || c == 0 || steps++ > m_cot.size()) return false;
        const uint32_t next = m_cot[c].next;
        if (next == 0) return false;
        // Until the directories that named the chain have been written, the saved table keeps
        // the cluster in use and allocation passes it over (applyPendingFrees).
        m_pendingFrees.emplace(c, m_cot[c]);
        m_cache.drop(c);
        m_cot[c].next = 0;
        m_cot[c].offset = 0;
        c = next;
    }
    return true;
}

void Vaultora::applyPendingFrees() {
    for (const auto& [c, entry] : m_pendingFrees) {
        // The cluster file stays until the table that no longer names it has been saved.
        if (entry.inClusterFile() && !(c < m_cot.size() && m_cot[c].used())) m_pendingClusterFileDeletes.push_back(c);
    }
    m_pendingFrees.clear();
}

std::vector<CotEntry> Vaultora::tableToSave() const {
    std::vector<CotEntry> table = m_cot;
    for (const auto& [c, entry] : m_pendingFrees)
        if (c < table.size() && !table[c].used()) table[c] = entry;
    return table;
}

void Vaultora::deletePendingClusterFiles() {
    for (uint32_t c : m_pendingClusterFileDeletes) {
        if (c < m_cot.size() && m_cot[c].used() && m_cot[c].inClusterFile()) continue;  // reused meanwhile
        fs::removeFile(clusterFilePath(c));
    }
    m_pendingClusterFileDeletes.clear();
}

uint32_t Vaultora::nextCluster(uint32_t c) const { return c < m_cot.size() ? m_cot[c].next : kEndOfChain; }

uint32_t Vaultora::previousCluster(uint32_t c) const {
    for (size_t i = m_cot.size(); i-- > 0;)
        if (m_cot[i].next == c) return static_cast<uint32_t>(i);
    return kNoCluster;
}

std::vector<uint32_t> Vaultora::chainClusters(uint32_t start) const {
    std::vector<uint32_t> out;
    uint32_t c = start;
    // Bounded by the table size: a damaged table with a loop still ends.
    while (c != kEndOfChain && c < m_cot.size() && m_cot[c].used() && out.size() <= m_cot.size()) {
        out.push_back(c);
        c = m_cot[c].next;
    }
    return out;
}

uint64_t Vaultora::computeDataEnd() const {
    uint64_t end = 0;
    for (const CotEntry& e : m_cot)
        if (e.used() && !e.inClusterFile() && e.size != 0) end = std::max<uint64_t>(end, e.offset + e.size);
    return end;
}

Result Vaultora::writeCotCopy(const std::vector<uint8_t>& record) {
    if (!ensureTemporaryFolder()) return kTempFolder;
    const std::string cot = crashPath(kCotFile);
    if (fs::exists(cot) && !fs::copyFile(cot, crashPath(kCotCopyFile))) return kCotCopyFailed;
    m_savedCotCopy.clear();
    File f;
    if (f.open(cot, OpenMode::kCreateAlways) != 0) return kCotCreateFailed;
    if (!f.writeAt(0, record.data(), record.size())) return kCotWriteFailed;
    if (!f.sync()) return kCotFlushFailed;
    m_savedCotCopy = record;
    return kOk;
}

Result Vaultora::saveClusterTable() {
    if (m_batch) return kOk;
    std::vector<uint8_t> record;
    if (Result rc = encodeCotRecord(tableToSave(), blockSize(), m_cipher, record); rc != kOk)
        return rc == kNoMemory ? kNoMemory : rc;
    if (record == m_savedCotCopy && fs::exists(crashPath(kCotFile))) {
        deletePendingClusterFiles();
        return kOk;  // ~COT.dat already holds exactly this table
    }
    if (Result rc = writeCotCopy(record); rc != kOk) return rc;
    deletePendingClusterFiles();
    if (m_header.cotOffset != kCotNotStored && m_header.cotLength != record.size()) {
        m_header.cotOffset = kCotNotStored;
        m_header.cotLength = static_cast<uint32_t>(record.size());
        return saveHeader();
    }
    return kOk;
}

Result Vaultora::saveClusterTable(uint64_t position) {
    if (!m_modified) return kOk;
    std::vector<uint8_t> record;
    if (Result rc = encodeCotRecord(m_cot, blockSize(), m_cipher, record); rc != kOk) return rc;
    if (Result rc = writeCotCopy(record); rc != kOk) return rc;
    deletePendingClusterFiles();
    m_header.cotOffset = position;
    m_header.cotLength = static_cast<uint32_t>(record.size());
    const uint64_t at = dataStart() + position;
    if (!m_file.truncate(at)) return kWriteFailed;
    if (!m_file.writeAt(at, record.data(), record.size())) return kCotWriteFailed;
    if (!m_file.sync()) return kFlushFailed;
    // Read the stored table back and compare it with the one in memory.
    std::vector<uint8_t> back(record.size());
    std::vector<CotEntry> stored;
    if (!m_file.readExact(at, back.data(), back.size()) ||
        decodeCotRecord(back.data(), back.size(), blockSize(), m_cipher, stored) != kOk)
        return kCotReadBackDiffers;
    const size_t n = std::max(stored.size(), m_cot.size());
    for (size_t i = 0; i < n; ++i) {
        CotEntry a = i < stored.size() ? stored[i] : CotEntry{};
        CotEntry b = i < m_cot.size() ? m_cot[i] : CotEntry{};
        if (!b.used()) b = CotEntry{};
        if (!(a == b)) return kCotReadBackDiffers;
    }
    m_dataEnd = position;
    m_storedCot = std::move(record);
    return saveHeader();
}

Result Vaultora::saveHeader(cSymAlg* cipher) {
    if (!ensureTemporaryFolder()) return kTempFolder;
    std::array<uint8_t, 20> check{};
    if (Result rc = computeHeaderCheck(cipher, check); rc != kOk) return rc;
    m_header.headerCheck = check;
    std::array<uint8_t, 68> image = m_header.encode();
    const uint32_t size = m_header.size();
    const std::string copy = crashPath(kSignatureFile);
    if (!fs::writeWholeFile(copy, image.data(), size)) return kSignatureWriteFailed;
    std::array<uint8_t, 68> found{};
    Header h;
    auto reader = [this](uint64_t off, uint8_t* buf, size_t n) { return m_file.readAt(off, buf, n); };
    if (!findHeader(reader, m_header.embeddedOffset, h, found) || h.embeddedOffset != m_header.embeddedOffset)
        return kReadFailed;
    if (!m_file.writeAt(m_header.embeddedOffset, image.data(), size)) return kWriteFailed;
    if (!m_file.sync()) return kFlushFailed;
    fs::removeFile(copy);
    return kOk;
}

// ---------------------------------------------------------------------------------------------
// Key blocks

Result Vaultora::readMasterKeyBlock(SecureBytes& block) {
    block.clear();
    if (m_header.dataOffset < m_header.masterKeyOffset) return kInconsistent;
    const size_t length = m_header.dataOffset - m_header.masterKeyOffset;
    if (length == 0) return kOk;
    if (m_useMasterKeyCopy) {
        if (m_masterKeyCopy.size() < length) return kReadFailed;
        block.assign(m_masterKeyCopy.begin(), m_masterKeyCopy.begin() + static_cast<long>(length));
        return kOk;
    }
    const int64_t fileSize = m_file.size();
    const uint64_t pos = static_cast<uint64_t>(m_header.embeddedOffset) + m_header.masterKeyOffset;
    if (fileSize < 0 || pos + length > static_cast<uint64_t>(fileSize)) return kReadFailed;
    block.resize(length);
    if (!m_file.readExact(pos, block.data(), length)) return kReadFailed;
    return kOk;
}

bool Vaultora::readExtendedKeyBlock(SecureBytes& block) {
    block.clear();
    std::vector<uint8_t> bytes;
    const std::string copy = crashPath(kExtendedCopyFile);
    if (fs::exists(copy)) {
        if (!fs::readWholeFile(copy, bytes)) return false;
    } else {
        if (m_header.cotOffset == kCotNotStored) return true;
        const uint64_t pos = dataStart() + m_header.cotOffset + m_header.cotLength;
        const int64_t fileSize = m_file.size();
        if (fileSize < 0 || pos > static_cast<uint64_t>(fileSize)) return false;
        // Thousands of key packets fit in far less; more is a damaged header pointing elsewhere.
        if (static_cast<uint64_t>(fileSize) - pos > kMaxExtendedKeyBlock) return false;
        bytes.resize(static_cast<size_t>(static_cast<uint64_t>(fileSize) - pos));
        if (!m_file.readExact(pos, bytes.data(), bytes.size())) return false;
    }
    block.assign(bytes.begin(), bytes.end());
    secureWipe(bytes.data(), bytes.size());
    // A block whose packets do not frame within it is damaged.
    return block.empty() || CheckExtendedKeyBlock(block.data(), block.size()) == kOk;
}

void Vaultora::backupExtendedKeyBlock() {
    if (!m_header.hasExtendedBlock()) return;
    const std::string copy = crashPath(kExtendedCopyFile);
    if (fs::exists(copy)) return;
    SecureBytes block;
    if (!readExtendedKeyBlock(block) || block.empty()) return;
    if (!ensureTemporaryFolder()) return;
    fs::writeWholeFile(copy, block.data(), block.size());
}

bool Vaultora::writeExtendedKeyBlock(const SecureBytes& block) {
    const std::string copy = crashPath(kExtendedCopyFile);
    const bool wantFlag = !block.empty();
    if (wantFlag != m_header.hasExtendedBlock()) {
        m_header.flags = static_cast<uint8_t>(wantFlag ? (m_header.flags | 1) : (m_header.flags & ~1));
        if (saveHeader() != kOk) return false;
    }
    if (!ensureTemporaryFolder()) return false;
    // The copy file first: while it exists it is the block that counts.
    const std::string tmp = copy + ".tmp";
    if (!fs::writeWholeFile(tmp, block.data(), block.size())) return false;
    if (!fs::renameFile(tmp, copy)) return false;
    if (m_header.cotOffset != kCotNotStored) {
        const uint64_t pos = dataStart() + m_header.cotOffset + m_header.cotLength;
        if (!block.empty() && !m_file.writeAt(pos, block.data(), block.size())) return false;
        if (!m_file.truncate(pos + block.size())) return false;
        if (!m_file.sync()) return false;
        fs::removeFile(copy);
    } else {
        if (markModified() != kOk) return false;
        if (block.empty()) fs::removeFile(copy);
    }
    return true;
}

Result Vaultora::writeMasterKeyBlock(const SecureBytes& block) {
    const size_t length = m_header.dataOffset - m_header.masterKeyOffset;
    if (block.size() != length) return kKeyBlockWrite;  // the master key block is never resized
    if (!ensureTemporaryFolder()) return kTempFolder;
    const std::string copy = crashPath(kMasterCopyFile);
    if (!fs::writeWholeFile(copy, block.data(), block.size())) return kKeyBlockWrite;
    const uint64_t pos = static_cast<uint64_t>(m_header.embeddedOffset) + m_header.masterKeyOffset;
    if (!m_file.writeAt(pos, block.data(), block.size()) || !m_file.sync()) return kKeyBlockWrite;
    fs::removeFile(copy);
    m_masterKeyCopy.clear();
    m_useMasterKeyCopy = false;
    return kOk;
}

// ---------------------------------------------------------------------------------------------
// ~Cluster.dat: a record on its way to another place in the archive (compaction).

Result Vaultora::writeClusterCopy(uint32_t c, const std::vector<uint8_t>& record) {
    if (!ensureTemporaryFolder()) return kTempFolder;
    std::vector<uint8_t> bytes(8 + record.size());
    putU32(bytes.data(), c);
    putU32(bytes.data() + 4, static_cast<uint32_t>(record.size()));
    std::memcpy(bytes.data() + 8, record.data(), record.size());
    if (!fs::writeWholeFile(crashPath(kClusterCopyFile), bytes.data(), bytes.size())) return kWriteFailed;
    return kOk;
}

void Vaultora::deleteClusterCopy() { fs::removeFile(crashPath(kClusterCopyFile)); }

Result Vaultora::restoreClusterCopy() {
    const std::string path = crashPath(kClusterCopyFile);
    if (!fs::exists(path)) return kOk;
    std::vector<uint8_t> bytes;
    if (!fs::readWholeFile(path, bytes) || bytes.size() < 8) return kClusterCopyUnreadable;
    const uint32_t c = getU32(bytes.data());
    const uint32_t n = getU32(bytes.data() + 4);
    if (bytes.size() != 8ull + n || c >= m_cot.size() || !m_cot[c].used() || m_readOnly) return kClusterCopyUnreadable;
    std::vector<uint8_t> record(bytes.begin() + 8, bytes.end());
    uint64_t offset = 0;
    if (Result rc = appendRecord(record, offset); rc != kOk) return rc;
    m_cot[c].offset = offset;
    m_cot[c].size = n;
    if (Result rc = saveClusterTable(); rc != kOk) return rc;
    deleteClusterCopy();
    return kOk;
}

// ---------------------------------------------------------------------------------------------
// Batch mode and commit

bool Vaultora::setBatch(bool on) {
    const bool previous = m_batch;
    if (on == previous) return previous;
    if (on) {
        if (m_modified) (void)saveClusterTable();
        m_batch = true;
        m_cache.setWriteBack(true);
    } else {
        m_batch = false;
        // A failure leaves the changed directories in the cache; the commit tries them again.
        if (m_modified) (void)flushDirectoryCache();
        m_cache.setWriteBack(false);
    }
    return previous;
}

Result Vaultora::flushDirectoryCache() {
    if (!m_modified) return kOk;
    // The table goes first, so the directories written next never name clusters it calls free;
    // the clusters they no longer name are freed once they are written.
    Result rc = saveTableNow();
    if (rc == kOk) {
        auto writer = [this](uint32_t c, const SecureBytes& data) { return writeClusterFile(c, data); };
        rc = m_cache.flush(writer);
    }
    if (rc != kOk) return rc;
    applyPendingFrees();
    return saveTableNow();
}

Result Vaultora::commitTail() {
    if (!m_file.isOpen() || m_readOnly) return kCannotOpen;
    if (m_batch) setBatch(false);
    if (Result rc = flushDirectoryCache(); rc != kOk) return rc;
    if (Result rc = markModified(); rc != kOk) return rc;
    uint64_t end = m_dataEnd;
    if (Result rc = moveAllClusterFiles(end); rc != kOk) return rc;
    if (Result rc = saveClusterTable(end); rc != kOk) return rc;
    SecureBytes ext;
    const std::string copy = crashPath(kExtendedCopyFile);
    if (fs::exists(copy)) {
        std::vector<uint8_t> bytes;
        if (!fs::readWholeFile(copy, bytes)) return kReadFailed;
        ext.assign(bytes.begin(), bytes.end());
        if (!writeExtendedKeyBlock(ext)) return kKeyBlockWrite;
    } else if (m_header.hasExtendedBlock()) {
        // The block is backed up at the first change; without that copy nothing stands behind the
        // table any more, so the flag must not claim a block.
        if (!writeExtendedKeyBlock(SecureBytes())) return kKeyBlockWrite;
    }
    m_modified = false;
    m_clean = true;
    m_ui->progressPercent(-1);
    return kOk;
}

}  // namespace vaultora
