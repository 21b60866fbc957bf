#include "operations/add.h"

#include <algorithm>
#include <cstring>
#include <vector>

#include "archive/directory.h"
#include "archive/walk.h"
#include "platform/disk_file.h"
#include "platform/disk_names.h"
#include "platform/file.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

int streamAnswer = kAnswerYes;

namespace {

std::string baseName(const std::string& path) {
    std::string p = path;
    while (p.size() > 1 && p.back() == '/') p.pop_back();
    const size_t slash = p.find_last_of('/');
    return slash == std::string::npos ? p : p.substr(slash + 1);
}

bool isFolderUnit(const uint8_t* record) { return (unit::attributes(record) & kAttrFolder) != 0; }

}  // namespace

// The bytes of a disk item: a regular file read in pieces, or a link target or stream value held
// in memory.
class BodySource {
public:
    Result open(const DiskItem& item) {
        if (item.isStream()) {
            if (!readStream(item.path, item.stream, m_memory)) return kReadFailed;
            m_inMemory = true;
            size = m_memory.size();
            return kOk;
        }
        DiskInfo info;
        if (!diskInfo(item.path, info)) return kReadFailed;
        if (info.kind == DiskKind::kSymlink) {
            std::string target;
            if (!readLink(item.path, target)) return kReadFailed;
            m_memory.assign(target.begin(), target.end());
            m_inMemory = true;
            size = m_memory.size();
            return kOk;
        }
        if (m_file.open(item.path, OpenMode::kRead) != 0) return kReadFailed;
        const int64_t n = m_file.size();
        if (n < 0) return kReadFailed;
        size = static_cast<uint64_t>(n);
        return kOk;
    }
    bool heldForWriting() const { return !m_inMemory && heldOpenForWriting(m_file.fd()); }
    // Reads exactly n bytes from the current position.
    bool read(uint8_t* out, size_t n) {
        if (m_inMemory) {
            if (m_position + n > m_memory.size()) return false;
            std::memcpy(out, m_memory.data() + m_position, n);
        } else if (!m_file.readExact(m_position, out, n)) {
            return false;
        }
        m_position += n;
        return true;
    }
    void close() { m_file.close(); }
    uint64_t size = 0;

private:
    File m_file;
    SecureBytes m_memory;
    bool m_inMemory = false;
    uint64_t m_position = 0;
};

namespace {

Result defaultWipe(const std::string& path) {
    File f;
    if (f.open(path, OpenMode::kReadWrite) != 0) return kReadFailed;
    const int64_t size = f.size();
    std::vector<uint8_t> zeros(std::min<int64_t>(std::max<int64_t>(size, 0), kMaxPayload), 0);
    for (int64_t off = 0; off < size; off += static_cast<int64_t>(zeros.size())) {
        const size_t n = static_cast<size_t>(std::min<int64_t>(size - off, static_cast<int64_t>(zeros.size())));
        if (!f.writeAt(static_cast<uint64_t>(off), zeros.data(), n)) return kWriteFailed;
    }
    if (!f.sync()) return kFlushFailed;
    f.close();
    return fs::removeFile(path) ? kOk : kWriteFailed;
}

}  // namespace

Adder::Adder(Vaultora& archive, AddOptions options) : m_archive(archive), m_options(std::move(options)) {
    if (m_options.cancelFlag != nullptr) m_archive.pCancelFlag = m_options.cancelFlag;
    if (!m_options.wipe) m_options.wipe = defaultWipe;
    m_previousBatch = m_archive.setBatch(true);
}

Adder::~Adder() {
    (void)flush();
    m_archive.setBatch(m_previousBatch);
}

Result Adder::flush() {
    if (!m_room.dirty) return kOk;
    return m_archive.writeDirectoryCluster(m_room, true);
}

// ---------------------------------------------------------------------------------------------
// The folders held for change

Result Adder::clusterBuffer(uint32_t cluster, ChainBuffer*& out) {
    if (m_room.cluster != cluster || m_room.data.empty()) {
        if (m_room.cluster != cluster) {
            if (Result rc = flush(); rc != kOk) return rc;
            m_room.reset();
            m_room.cluster = cluster;
        }
        if (Result rc = m_archive.readCluster(m_room); rc != kOk) return kDirReadFailed;
    }
    out = &m_room;
    return kOk;
}

Result Adder::folderIndex(uint32_t folder, FolderIndex*& out) {
    auto it = m_folders.find(folder);
    if (it != m_folders.end()) {
        out = &it->second;
        return kOk;
    }
    if (Result rc = flush(); rc != kOk) return rc;
    if (folder >= m_archive.cot().size()) return kInconsistent;
    FolderIndex index;
    const std::vector<uint32_t> chain = m_archive.chainClusters(folder);
    if (chain.empty()) return kInconsistent;
    for (uint32_t c : chain) {
        ChainBuffer b;
        b.cluster = c;
        if (m_archive.readCluster(b) != kOk) return kDirReadFailed;
        for (size_t off = 0; off + kUnitFixedSize <= b.data.size();) {
            const uint8_t* r = b.data.data() + off;
            if (!unit::valid(r, b.data.size() - off)) return kInconsistent;
            if (unit::kind(r) != kUnitDeleted && unit::kind(r) != kUnitVolume) index.names.emplace(unit::name(r), c);
            off += unit::length(r);
        }
    }
    out = &m_folders.emplace(folder, std::move(index)).first->second;
    return kOk;
}

Result Adder::lookup(uint32_t folder, std::u16string_view name, uint32_t& cluster, SecureBytes* copy) {
    FolderIndex* index = nullptr;
    if (Result rc = folderIndex(folder, index); rc != kOk) return rc;
    auto it = index->names.find(std::u16string(name));
    if (it == index->names.end()) return kNotFound;
    cluster = it->second;
    ChainBuffer* b = nullptr;
    if (Result rc = clusterBuffer(cluster, b); rc != kOk) return rc;
    for (size_t off = 0; off + kUnitFixedSize <= b->data.size();) {
        const uint8_t* r = b->data.data() + off;
        if (!unit::valid(r, b->data.size() - off)) break;
        if (unit::kind(r) != kUnitDeleted && recordNameEquals(r, name)) {
            if (copy != nullptr) copy->assign(r, r + unit::length(r));
            return kOk;
        }
        off += unit::length(r);
    }
    return kNotFound;
}

Result Adder::insertRecord(uint32_t folder, const SecureBytes& record) {
    FolderIndex* index = nullptr;
    if (Result rc = folderIndex(folder, index); rc != kOk) return rc;
    const std::vector<uint32_t> chain = m_archive.chainClusters(folder);
    if (chain.empty()) return kInconsistent;
    const bool holdsChainCluster = std::find(chain.begin(), chain.end(), m_room.cluster) != chain.end();
    if (!holdsChainCluster || m_room.data.size() + record.size() > kMaxPayload) {
        ChainBuffer* b = nullptr;
        if (Result rc = clusterBuffer(chain.back(), b); rc != kOk) return rc;
        if (b->data.size() + record.size() > kMaxPayload) {
            // The folder's directory grows by one cluster.
            if (Result rc = flush(); rc != kOk) return rc;
            uint32_t added = kNoCluster;
            if (Result rc = m_archive.appendCluster(folder, added); rc != kOk) return rc;
            m_room.reset();
            m_room.cluster = added;
        }
    }
    m_room.data.insert(m_room.data.end(), record.begin(), record.end());
    m_room.dirty = true;
    index->names[unit::name(record.data())] = m_room.cluster;
    return kOk;
}

Result Adder::removeRecord(uint32_t folder, std::u16string_view name, uint32_t cluster) {
    FolderIndex* index = nullptr;
    if (Result rc = folderIndex(folder, index); rc != kOk) return rc;
    ChainBuffer* b = nullptr;
    if (Result rc = clusterBuffer(cluster, b); rc != kOk) return rc;
    for (size_t off = 0; off + kUnitFixedSize <= b->data.size();) {
        uint8_t* r = b->data.data() + off;
        if (!unit::valid(r, b->data.size() - off)) break;
        if (unit::kind(r) != kUnitDeleted && recordNameEquals(r, name)) {
            markDeleted(r);
            squeeze(*b);
            index->names.erase(std::u16string(name));
            return kOk;
        }
        off += unit::length(r);
    }
    return kInconsistent;
}

Result Adder::replaceRecord(uint32_t folder, std::u16string_view name, uint32_t oldCluster, const SecureBytes& record) {
    FolderIndex* index = nullptr;
    if (Result rc = folderIndex(folder, index); rc != kOk) return rc;
    ChainBuffer* b = nullptr;
    if (Result rc = clusterBuffer(oldCluster, b); rc != kOk) return rc;
    size_t oldLength = 0;
    for (size_t off = 0; off + kUnitFixedSize <= b->data.size();) {
        const uint8_t* r = b->data.data() + off;
        if (!unit::valid(r, b->data.size() - off)) break;
        if (unit::kind(r) != kUnitDeleted && recordNameEquals(r, name)) { oldLength = unit::length(r); break; }
        off += unit::length(r);
    }
    if (oldLength == 0) return kInconsistent;
    if (b->data.size() - oldLength + record.size() <= kMaxPayload) {
        // Both changes in one cluster: one write swaps the versions.
        if (Result rc = removeRecord(folder, name, oldCluster); rc != kOk) return rc;
        m_room.data.insert(m_room.data.end(), record.begin(), record.end());
        m_room.dirty = true;
        index->names[std::u16string(name)] = oldCluster;
        return kOk;
    }
    // The new record goes elsewhere first; the old one is removed after that is written.
    index->names.erase(std::u16string(name));
    if (Result rc = insertRecord(folder, record); rc != kOk) return rc;
    const uint32_t newCluster = m_room.cluster;
    if (Result rc = flush(); rc != kOk) return rc;
    if (Result rc = removeRecord(folder, name, oldCluster); rc != kOk) return rc;
    index->names[std::u16string(name)] = newCluster;
    return flush();
}

// ---------------------------------------------------------------------------------------------
// Reporting

std::u16string Adder::itemText(const DiskItem& item) const {
    std::u16string text = fromUtf8(item.path);
    if (item.isStream()) text += u":" + fromUtf8(item.stream) + u":$DATA";
    return text;
}

std::u16string Adder::unitNameOf(const DiskItem& item) const {
    const std::u16string file = unitNameFromDisk(baseName(item.path));
    return item.isStream() ? streamUnitName(file, item.stream) : file;
}

void Adder::status(const DiskItem& item, std::u16string_view text) { m_archive.ui().progressLog(itemText(item), text); }

Result Adder::askTermination(bool alwaysAsk) {
    if (m_options.addFilesWindow && !alwaysAsk) return kCancelled;
    const int answer = m_archive.ui().message(msgFormat(Msg::kProcessTerminate, {msgText(Msg::kAddFilesToArchive)}),
                                              msgText(Msg::kCaptionAttention), mb::kYesNo | mb::kIconQuestion);
    if (answer == kAnswerYes) return kCancelled;
    if (m_options.cancelFlag != nullptr) *m_options.cancelFlag = 0;
    return kOk;
}

// ---------------------------------------------------------------------------------------------
// The walk

Result Adder::AddTree(std::u16string_view archiveFolder, const std::string& sourcePath, ToAllFlags& flags, int mode) {
    m_currentArchiveFolder = archiveFolder;
    if (m_archive.isReadOnly()) return kArchiveReadOnly;
    if (Result rc = flush(); rc != kOk) return rc;
    uint32_t folderUnit = 0;
    if (Result rc = resolveFolder(m_archive, archiveFolder, folderUnit); rc != kOk) return rc;
    if (folderUnit == kNoCluster) return kInconsistent;

    const size_t slash = sourcePath.find_last_of('/');
    const std::string diskFolder = slash == std::string::npos ? "." : (slash == 0 ? "/" : sourcePath.substr(0, slash));
    const std::string pattern = slash == std::string::npos ? sourcePath : sourcePath.substr(slash + 1);
    const std::string prefix = slash == std::string::npos ? "" : sourcePath.substr(0, slash + 1);
    const std::vector<std::string> names = pattern.empty() ? std::vector<std::string>{} : listMatching(diskFolder, pattern);
    if (names.empty()) {
        if (sourcePath == "/" && archiveFolder.empty()) return AddTree(u"", "/*", flags, mode);
        if (collecting()) {
            m_archive.collectedMessages->append(msgText(Msg::kSourceNotFound));
            m_archive.collectedMessages->append(fromUtf8(sourcePath) + u"\r\n");
        }
        return kReadFailed;
    }
    Result last = kOk;
    for (const std::string& name : names) {
        if (m_archive.cancelled()) return kCancelled;
        const std::string path = prefix + name;
        DiskInfo info;
        const bool isFolder = diskInfo(path, info) && info.kind == DiskKind::kFolder;
        const DiskItem item{path, {}};
        if (!isFolder) {
            ++filesSeen;
            for (;;) {
                Result rc = AddEntry(folderUnit, item, flags, mode);
                last = rc;
                if (rc == kOk || rc == kSkippedByAnswer) { last = kOk; break; }
                if (rc != kReadFailed && rc != kClusterWriteFailed) return rc;
                if (rc == kReadFailed && m_options.batchLog) {
                    m_options.batchLog(msgFormat(Msg::kErrorReadingSkipped, {fromUtf8(path)}));
                    last = kOk;
                    break;
                }
                const std::u16string text =
                    rc == kReadFailed ? msgFormat(Msg::kErrorReadingRetry, {fromUtf8(path)})
                                      : msgFormat(Msg::kErrorWritingNoSpace, {fromUtf8(path), fromUtf8(m_archive.path())});
                if (collecting()) {
                    m_archive.collectedMessages->append(text + u"\r\n");
                    return rc;
                }
                const int answer = m_archive.ui().message(text, msgText(Msg::kAddFilesToArchive),
                                                          mb::kAbortRetryIgnore | mb::kIconError | mb::kDefButton2);
                if (answer == kAnswerAbort) {
                    if (m_options.cancelFlag != nullptr) *m_options.cancelFlag = 1;
                    return kCancelled;
                }
                if (answer == kAnswerRetry) continue;
                last = kOk;
                break;
            }
            continue;
        }
        ++foldersSeen;
        Result rc = AddEntry(folderUnit, item, flags, mode);
        if (rc == kSkippedByAnswer) rc = kOk;
        if (rc == kOk) {
            const std::u16string sub = std::u16string(archiveFolder) + u"\\" + unitNameFromDisk(name);
            rc = AddTree(sub, path + "/*", flags, mode);
            m_currentArchiveFolder = archiveFolder;
            // An empty folder has nothing to match: that is not a missing source.
            if (rc == kReadFailed && listMatching(path, "*").empty()) rc = kOk;
            last = rc;
            if (rc != kOk && !collecting()) return rc;
            if (rc != kOk && collecting()) last = kOk;
        } else {
            if (!collecting()) return rc;
            m_archive.collectedMessages->append(msgFormat(Msg::kFileSkippedCollected, {fromUtf8(name)}) + u"\r\n");
        }
    }
    return last;
}

Result Adder::AddEntry(uint32_t folderUnit, const DiskItem& item, ToAllFlags& flags, int mode) {
    if (Result rc = AddFileChecked(folderUnit, item, flags, mode); rc != kOk) return rc;
    if (collecting()) streamAnswer = kAnswerYesAll;
    if (streamAnswer == kAnswerNoAll) return kOk;
    DiskInfo info;
    if (!diskInfo(item.path, info) || (info.kind != DiskKind::kFile && info.kind != DiskKind::kFolder)) return kOk;
    std::vector<std::string> streams;
    if (!listStreams(item.path, streams)) return kOk;
    for (const std::string& stream : streams) {
        if (stream.size() + 7 >= 260) break;
        ++filesSeen;
        if (streamAnswer != kAnswerYesAll) {
            const std::u16string listed = u":" + fromUtf8(stream) + u":$DATA";
            streamAnswer = m_archive.ui().askArchive(msgFormat(Msg::kStreamQuestionAdd, {listed, fromUtf8(item.path)}),
                                                     msgText(Msg::kCaptionAttention), mb::kRememberChoice);
        }
        if (streamAnswer == kAnswerNo || streamAnswer == kAnswerNoAll) return kOk;
        if (streamAnswer == kAnswerCancel) return kCancelled;
        if (Result rc = AddFileChecked(folderUnit, DiskItem{item.path, stream}, flags, mode); rc != kOk) return rc;
    }
    return kOk;
}

Result Adder::AddFileChecked(uint32_t folderUnit, const DiskItem& item, ToAllFlags& flags, int mode) {
    Interaction& ui = m_archive.ui();
    if (m_options.addFilesWindow) {
        ui.addFilesEvent(0xAA01, 0);
        ui.addFilesEvent(0xAA03, 0);
    } else {
        ui.progressTitle(msgText(Msg::kAddFilesToArchive));
        ui.progressStatus(itemText(item));
        ui.progressPercent(0);
    }
    if (!item.isStream()) {
        const std::string full = fullPath(item.path);
        const std::string archive = fullPath(m_archive.path());
        if (full.empty() || archive.empty()) {
            if (full.empty()) return kReadFailed;
        } else {
            if (full == archive) return kOk;
            if (full.size() == archive.size() + 4 && full.compare(0, archive.size(), archive) == 0 &&
                equalsIgnoreCaseAscii(std::string_view(full).substr(archive.size()), ".bst"))
                return kOk;
        }
        DiskInfo info;
        if (diskInfo(item.path, info) && info.kind == DiskKind::kOther) {
            status(item, msgText(Msg::kSkipped));
            return kOk;
        }
    }
    const std::u16string name = unitNameOf(item);
    uint32_t cluster = 0;
    SecureBytes found;
    Result rc = lookup(folderUnit, name, cluster, &found);
    if (rc != kOk && rc != kNotFound) {
        status(item, msgText(Msg::kErrorReadingDirectory));
        return m_archive.errorNote(kDirectoryUnusable, "HXZipWrite", __LINE__);
    }
    if (rc == kNotFound) {
        if (mode != kModeExport) return AddUnit(folderUnit, name, &item, flags, mode, false);
        status(item, msgText(Msg::kArchiveLacksExported));
        int answer = 0;
        if (flags.deleteAll) answer = kAnswerYes;
        else if (flags.keepAll) answer = kAnswerNo;
        else
            answer = ui.askArchive(msgFormat(Msg::kExportedNotInArchive, {itemText(item)}),
                                   msgText(Msg::kCaptionExportFile), mb::kRememberChoice);
        if (answer == kAnswerYesAll) { flags.deleteAll = true; answer = kAnswerYes; }
        if (answer == kAnswerNoAll) { flags.keepAll = true; answer = kAnswerNo; }
        if (answer == kAnswerYes) {
            if (item.isStream()) return kOk;  // a stream goes with its file
            Result wiped = m_options.wipe(item.path);
            if (wiped == kOk) status(item, msgText(Msg::kExportedWiped));
            return wiped;
        }
        if (answer == kAnswerNo) {
            status(item, msgText(Msg::kExportedWipeSkipped));
            return kSkippedByAnswer;
        }
        return answer == kAnswerCancel ? kCancelled : kUnexpectedAnswer;
    }
    if (!isFolderUnit(found.data())) {
        const int c = CompareFileDate(found.data(), item);
        bool skip = false;
        if (mode == kModeSynchronize) {
            if (c > 0) status(item, msgText(Msg::kArchiveLatest));
            skip = c >= 0;
        } else if (mode == kModeImport) {
            if (c == 0) {
                skip = true;
            } else if (c > 0) {
                const std::u16string unitPath = m_currentArchiveFolder.empty() || m_currentArchiveFolder == u"\\"
                                                    ? name
                                                    : m_currentArchiveFolder + u"\\" + name;
                if (unitPath == u"AutoRun.inf" || unitPath == u"\\AutoRun.inf") {
                    skip = true;
                } else {
                    status(item, msgText(Msg::kArchiveLatest));
                    int answer = 0;
                    if (flags.overwriteAll) answer = kAnswerYes;
                    else if (flags.skipAll) answer = kAnswerNo;
                    else {
                        DiskInfo info;
                        diskInfo(item.path, info);
                        answer = ui.askArchive(
                            msgFormat(Msg::kImportDateEarly,
                                      {Vaultora::formatFileTime(info.modified), sizeText(info.size), itemText(item),
                                       Vaultora::formatFileTime(unit::modified(found.data())),
                                       sizeText(unit::size(found.data())), unitPath}),
                            msgText(Msg::kCaptionImportFile), mb::kRememberChoice);
                    }
                    switch (answer) {
                        case kAnswerYesAll: flags.overwriteAll = true; break;
                        case kAnswerYes: break;
                        case kAnswerNoAll: flags.skipAll = true; skip = true; break;
                        case kAnswerNo: skip = true; break;
                        case kAnswerCancel: return kCancelled;
                        default: return kUnexpectedAnswer;
                    }
                }
            }
        } else {
            skip = c == 0 && IsSameBody(found.data(), item, false);
        }
        if (skip) {
            if (m_options.verboseLog && m_options.batchLog)
                m_options.batchLog(msgFormat(Msg::kSameBodySkipped, {itemText(item)}));
            return kOk;
        }
    }
    return AddUnit(folderUnit, name, &item, flags, mode, true);
}

int Adder::CompareFileDate(const uint8_t* unitRecord, const DiskItem& item) {
    DiskInfo info;
    if (!diskInfo(item.path, info)) return 2;
    const uint64_t mine = unit::modified(unitRecord);
    if (mine > info.modified) return 1;
    if (mine < info.modified) return -1;
    return 0;
}

bool Adder::IsSameBody(const uint8_t* unitRecord, const DiskItem& item, bool sizeOnly) {
    if (unitRecord == nullptr) return false;
    BodySource source;
    if (source.open(item) != kOk) return false;
    const uint64_t size = unit::size(unitRecord);
    if ((size >> 32) != (source.size >> 32) || (size & 0xFFFFFFFF) != (source.size & 0xFFFFFFFF)) return false;
    if (sizeOnly || size == 0) return true;
    SecureBytes piece(static_cast<size_t>(std::min<uint64_t>(size, kMaxPayload)));
    if (unit::kind(unitRecord) == kUnitInline) {
        const uint32_t start = unit::start(unitRecord), length = unit::length(unitRecord);
        if (start > length || length - start != size) return false;
        if (!source.read(piece.data(), static_cast<size_t>(size))) return false;
        return std::memcmp(piece.data(), unitRecord + start, static_cast<size_t>(size)) == 0;
    }
    uint32_t c = unit::start(unitRecord);
    uint64_t done = 0;
    while (done < size) {
        if (c == kEndOfChain || c == 0 || c >= m_archive.cot().size()) return false;
        const size_t n = static_cast<size_t>(std::min<uint64_t>(kMaxPayload, size - done));
        if (!source.read(piece.data(), n)) return false;
        ChainBuffer b;
        b.cluster = c;
        if (m_archive.readCluster(b) != kOk || b.data.size() != n) return false;
        if (std::memcmp(b.data.data(), piece.data(), n) != 0) return false;
        done += n;
        if (m_options.addFilesWindow) m_archive.ui().addFilesEvent(0xAA04, n);
        else m_archive.ui().progressPercent(static_cast<int>(done * 100 / size));
        c = m_archive.nextCluster(c);
    }
    return c == kEndOfChain;
}

// ---------------------------------------------------------------------------------------------
// Units and bodies

Result Adder::AddUnit(uint32_t folderUnit, std::u16string_view name, const DiskItem* item, ToAllFlags& flags, int mode,
                      bool nameExists, uint32_t adoptChain, bool isFolder) {
    DiskItem none;
    const DiskItem& shown = item != nullptr ? *item : none;
    FolderIndex* index = nullptr;
    if (Result rc = folderIndex(folderUnit, index); rc != kOk) {
        status(shown, msgText(Msg::kErrorReadingDirectory));
        return m_archive.errorNote(rc, "HXZipWrite", __LINE__);
    }
    DiskInfo info;
    const bool haveInfo = item != nullptr && diskInfo(item->path, info);
    if (item != nullptr && !item->isStream()) isFolder = haveInfo && info.isFolder();

    uint32_t oldCluster = kNoCluster;
    SecureBytes old;
    if (nameExists) {
        if (lookup(folderUnit, name, oldCluster, &old) != kOk) {
            status(shown, msgText(Msg::kInputDataCorrupted));
            return m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
        }
        if (isFolderUnit(old.data())) {
            if (item == nullptr || !haveInfo) {
                status(shown, msgText(Msg::kInputDataCorrupted));
                return m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
            }
            if (isFolder) return kOk;  // merged into the existing folder
            m_archive.ui().message(msgFormat(Msg::kFileOverFolder, {itemText(*item)}), msgText(Msg::kCaptionAddFile),
                                   mb::kOk | mb::kIconWarning);
            status(shown, msgText(Msg::kInputDataCorrupted));
            return m_archive.errorNote(kInconsistent, "HXZipWrite", __LINE__);
        }
        if (mode == kModePlain) {
            int answer = 0;
            if (flags.overwriteAll) answer = kAnswerYes;
            else if (flags.skipAll) answer = kAnswerNo;
            else {
                const std::u16string unitPath = joinUnitPath(m_currentArchiveFolder, name);
                answer = m_archive.ui().askArchive(msgFormat(Msg::kArchiveContainsFile, {u"\\" + unitPath}),
                                                   msgText(Msg::kCaptionAttention), mb::kRememberChoice);
            }
            switch (answer) {
                case kAnswerYesAll: flags.overwriteAll = true; break;
                case kAnswerYes: break;
                case kAnswerNoAll: flags.skipAll = true; [[fallthrough]];
                case kAnswerNo: status(shown, msgText(Msg::kSkipped)); return kOk;
                case kAnswerCancel: status(shown, msgText(Msg::kSkipped)); return kCancelled;
                default: return kUnexpectedAnswer;
            }
        }
    }

    // The new record.
    SecureBytes record;
    if (item == nullptr) {
        record = makeRecordWithAttributes(name, 0, isFolder ? kAttrFolder : 0);
    } else if (item->isStream()) {
        SecureBytes value;
        if (!haveInfo || !readStream(item->path, item->stream, value)) {
            status(shown, msgFormat(Msg::kErrorCode, {1u}));
            return m_archive.errorNote(kSourceAttributes, "HXZipWrite", __LINE__);
        }
        record = makeRecordWithAttributes(name, value.size() < kInlineThreshold ? static_cast<uint32_t>(value.size()) : 0,
                                          kAttrArchive);
        unit::setTimes(record.data(), info.created, info.modified, info.accessed);
        unit::setSize(record.data(), value.size());
    } else {
        if (Result rc = makeUnitRecord(name, &item->path, !isFolder, record); rc != kOk) {
            status(shown, msgFormat(Msg::kErrorCode, {1u}));
            return m_archive.errorNote(rc, "HXZipWrite", __LINE__);
        }
    }

    // The body first: until the record is in the directory, a failure costs nothing but the new
    // chain, which is freed again.
    uint32_t newChain = kNoCluster;
    if (adoptChain != kNoCluster) {
        unit::setStart(record.data(), adoptChain);
    } else if (isFolder) {
        newChain = m_archive.allocateCluster(kNoCluster);
        if (newChain == kNoCluster) {
            status(shown, msgFormat(Msg::kErrorCode, {4u}));
            return m_archive.errorNote(kNoMemory, "HXZipWrite", __LINE__);
        }
        unit::setStart(record.data(), newChain);
    } else if (item == nullptr) {
        unit::setStart(record.data(), kNoCluster);
    } else {
        m_skipHeld = false;
        Result rc = unit::kind(record.data()) == kUnitInline ? WriteEmbeddedBody(*item, record) : WriteFileBody(*item, record);
        if (rc == kOk && m_skipHeld) {
            status(shown, msgText(Msg::kSkipped));
            return kOk;
        }
        if (rc != kOk) {
            status(shown, msgFormat(Msg::kErrorCode, {5u}));
            return m_archive.errorNote(rc, "HXZipWrite", __LINE__);
        }
        if (unit::kind(record.data()) != kUnitInline) newChain = unit::start(record.data());
    }

    Result rc = kOk;
    if (nameExists) {
        rc = replaceRecord(folderUnit, name, oldCluster, record);
    } else {
        rc = insertRecord(folderUnit, record);
    }
    if (rc != kOk) {
        if (newChain != kNoCluster && newChain != 0) m_archive.freeChain(newChain);
        status(shown, msgFormat(Msg::kErrorCode, {nameExists ? 3u : 2u}));
        return m_archive.errorNote(rc, "HXZipWrite", __LINE__);
    }
    if (isFolder && newChain != kNoCluster) m_folders.emplace(newChain, FolderIndex{});
    if (nameExists && unit::kind(old.data()) == kUnitChain) {
        // The old body goes only now that the directory names the new one.
        const uint32_t oldStart = unit::start(old.data());
        if (oldStart != 0 && oldStart != kNoCluster) {
            if (Result fr = flush(); fr != kOk) return m_archive.errorNote(fr, "HXZipWrite", __LINE__);
            m_archive.freeChain(oldStart);
        }
    }
    if (item != nullptr && !isFolder) ++filesAdded;
    if (Result sr = m_archive.saveClusterTable(); sr != kOk) {
        status(shown, msgFormat(Msg::kErrorCode, {static_cast<unsigned>(sr)}));
        return m_archive.errorNote(sr, "HXZipWrite", __LINE__);
    }
    status(shown, msgText(Msg::kAdded));
    return kOk;
}

Result Adder::WriteEmbeddedBody(const DiskItem& item, SecureBytes& record) {
    BodySource source;
    if (source.open(item) != kOk) return kReadFailed;
    const uint32_t start = unit::start(record.data());
    const uint32_t length = static_cast<uint32_t>(record.size());
    if (source.size != length - start) return kReadFailed;
    if (!source.read(record.data() + start, length - start)) return kReadFailed;
    if (m_options.addFilesWindow) m_archive.ui().addFilesEvent(0xAA04, length - start);
    return kOk;
}

Result Adder::WriteFileBody(const DiskItem& item, SecureBytes& record) {
    BodySource source;
    if (source.open(item) != kOk) return kReadFailed;
    if (source.heldForWriting()) {
        const std::u16string text = msgFormat(Msg::kHeldForWriting, {fromUtf8(item.path)});
        if (m_options.batchLog) {
            m_options.batchLog(std::u16string(msgText(Msg::kCaptionWarning)) + u" " + text +
                               std::u16string(msgText(Msg::kHeldWrittenAnyway)));
        } else {
            const int answer = m_archive.ui().message(text + std::u16string(msgText(Msg::kHeldWriteAnyway)),
                                                      msgText(Msg::kCaptionAttention), mb::kYesNoCancel | mb::kIconWarning);
            if (answer == kAnswerNo) {
                m_skipHeld = true;
                return kOk;
            }
            if (answer != kAnswerYes) return kReadFailed;
        }
    }
    // The record was made from an earlier look at the file; the body is what is read now.
    unit::setSize(record.data(), source.size);
    return writeChainFromSource(source, record, false);
}

Result Adder::writeChainFromSource(BodySource& source, SecureBytes& record, bool alwaysAskOnCancel) {
    if (source.size == 0) {
        unit::setStart(record.data(), 0);
        return kOk;
    }
    uint32_t current = m_archive.allocateCluster(kNoCluster);
    if (current == kNoCluster) return kNoFreeCluster;
    const uint32_t start = current;
    unit::setStart(record.data(), start);
    SecureBytes piece(static_cast<size_t>(std::min<uint64_t>(source.size, kMaxPayload)));
    uint64_t done = 0;
    Result rc = kOk;
    int lastPercent = -1;
    while (done < source.size) {
        if (m_archive.cancelled()) {
            if ((rc = askTermination(alwaysAskOnCancel)) != kOk) break;
        }
        const size_t n = static_cast<size_t>(std::min<uint64_t>(kMaxPayload, source.size - done));
        if (!source.read(piece.data(), n)) { rc = kReadFailed; break; }
        uint32_t next = kEndOfChain;
        if (done + n < source.size) {
            next = m_archive.allocateCluster(current);
            if (next == kNoCluster) { rc = kNoFreeCluster; break; }
            m_archive.mutableCot()[current].next = next;
        }
        if ((rc = m_archive.writeDataCluster(current, piece.data(), static_cast<uint32_t>(n), false)) != kOk) break;
        done += n;
        if (m_options.addFilesWindow) {
            m_archive.ui().addFilesEvent(0xAA04, n);
        } else {
            const int percent = static_cast<int>(done * 100 / source.size);
            if (percent != lastPercent) m_archive.ui().progressPercent(lastPercent = percent);
        }
        current = next;
    }
    source.close();
    if (rc != kOk) {
        m_archive.freeChain(start);
        unit::setStart(record.data(), 0);
        return rc;
    }
    return m_archive.saveClusterTable();
}

Result Adder::AddMemoryFile(uint32_t folderUnit, std::u16string_view name, const uint8_t* data, uint64_t size,
                            uint32_t attributes, ToAllFlags* flags) {
    if (m_archive.isReadOnly()) return kArchiveReadOnly;
    uint32_t oldCluster = kNoCluster;
    SecureBytes old;
    Result found = lookup(folderUnit, name, oldCluster, &old);
    if (found != kOk && found != kNotFound) return m_archive.errorNote(found, "HXZipWrite", __LINE__);
    const bool exists = found == kOk;
    if (exists) {
        if (isFolderUnit(old.data())) {
            m_archive.ui().message(msgFormat(Msg::kFileOverFolder, {name}), msgText(Msg::kCaptionAddFile),
                                   mb::kOk | mb::kIconWarning);
            return kInconsistent;
        }
        int answer = 0;
        if (flags != nullptr && flags->overwriteAll) answer = kAnswerYes;
        else if (flags != nullptr && flags->skipAll) answer = kAnswerNo;
        else
            answer = m_archive.ui().askArchive(msgFormat(Msg::kArchiveContainsFile, {name}), msgText(Msg::kCaptionAttention),
                                               mb::kRememberChoice);
        if (answer == kAnswerNo || answer == kAnswerNoAll) return kOk;
        if (answer == kAnswerCancel) return kCancelled;
        if (answer == kAnswerYesAll && flags != nullptr) flags->overwriteAll = true;
        else if (answer != kAnswerYes && answer != kAnswerYesAll) return kUnexpectedAnswer;
    }
    if (size >= 0x100000000ull) return kInconsistent;
    SecureBytes record = makeRecordWithAttributes(name, size < kInlineThreshold ? static_cast<uint32_t>(size) : 0, attributes);
    unit::setSize(record.data(), size);
    uint32_t newChain = kNoCluster;
    if (unit::kind(record.data()) == kUnitInline) {
        const uint32_t start = unit::start(record.data());
        if (record.size() - start != size) return kInconsistent;
        std::memcpy(record.data() + start, data, static_cast<size_t>(size));
    } else if (size == 0) {
        unit::setStart(record.data(), 0);
    } else {
        // The memory body in pieces, through the same chain writer as disk files.
        uint32_t current = m_archive.allocateCluster(kNoCluster);
        if (current == kNoCluster) return kNoFreeCluster;
        newChain = current;
        unit::setStart(record.data(), current);
        Result rc = kOk;
        for (uint64_t done = 0; done < size;) {
            if (m_archive.cancelled() && (rc = askTermination(true)) != kOk) break;
            const size_t n = static_cast<size_t>(std::min<uint64_t>(kMaxPayload, size - done));
            uint32_t next = kEndOfChain;
            if (done + n < size) {
                next = m_archive.allocateCluster(current);
                if (next == kNoCluster) { rc = kNoFreeCluster; break; }
                m_archive.mutableCot()[current].next = next;
            }
            if ((rc = m_archive.writeDataCluster(current, data + done, static_cast<uint32_t>(n), false)) != kOk) break;
            done += n;
            current = next;
        }
        if (rc != kOk) {
            m_archive.freeChain(newChain);
            return m_archive.errorNote(rc, "HXZipWrite", __LINE__);
        }
    }
    Result rc = exists ? replaceRecord(folderUnit, name, oldCluster, record) : insertRecord(folderUnit, record);
    if (rc != kOk) {
        if (newChain != kNoCluster) m_archive.freeChain(newChain);
        return m_archive.errorNote(rc, "HXZipWrite", __LINE__);
    }
    if (exists && unit::kind(old.data()) == kUnitChain) {
        const uint32_t oldStart = unit::start(old.data());
        if (oldStart != 0 && oldStart != kNoCluster) {
            if (Result fr = flush(); fr != kOk) return fr;
            m_archive.freeChain(oldStart);
        }
    }
    if (Result fr = flush(); fr != kOk) return fr;
    return m_archive.saveClusterTable();
}

}  // namespace vaultora
