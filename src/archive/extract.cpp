#include "archive/extract.h"

#include "archive/directory.h"
#include "archive/remove.h"
#include "platform/disk_file.h"
#include "platform/disk_names.h"
#include "platform/text.h"

namespace vaultora {

namespace {

bool isLinkRecord(const uint8_t* record) {
    const uint32_t attributes = unit::attributes(record);
    return (attributes & kAttrPosixMode) != 0 && ((attributes >> 16) & kModeTypeMask) == kModeLink;
}

}  // namespace

std::string diskPathOfUnit(const std::string& base, std::u16string_view folderPath, std::u16string_view name) {
    std::string out = base;
    while (!out.empty() && out.back() == '/') out.pop_back();
    size_t pos = 0;
    while (pos <= folderPath.size()) {
        size_t slash = folderPath.find(u'\\', pos);
        if (slash == std::u16string_view::npos) slash = folderPath.size();
        if (slash > pos) out += "/" + diskNameFromUnit(folderPath.substr(pos, slash - pos));
        pos = slash + 1;
    }
    out += "/" + diskNameFromUnit(name);
    return out;
}

cExtractFileActorBlock::cExtractFileActorBlock(Vaultora& a, std::string targetBase, int mode)
    : m_archive(a), m_base(std::move(targetBase)), m_mode(mode) {}

Result cExtractFileActorBlock::askRemoval(Msg text, std::initializer_list<FormatArg> args, int yesFlag,
                                          uint8_t* record, std::u16string_view folderPath) {
    int answer = 0;
    if (toAll[yesFlag - 1]) answer = kAnswerYesAll;
    else if (toAll[yesFlag]) answer = kAnswerNoAll;
    else answer = m_archive.ui().askArchive(msgFormat(text, args), msgText(Msg::kCaptionAttention), mb::kRememberChoice);
    switch (answer) {
        case kAnswerYesAll: toAll[yesFlag - 1] = true; [[fallthrough]];
        case kAnswerYes: return removeUnitRecord(m_archive, record, folderPath);
        case kAnswerNoAll: toAll[yesFlag] = true; [[fallthrough]];
        case kAnswerNo: return kOk;
        case kAnswerCancel: return kCancelled;
        default: return kUnexpectedAnswer;
    }
}

Result cExtractFileActorBlock::actOnUnit(uint8_t* record, std::u16string_view folderPath) {
    if (m_archive.cancelled()) return kCancelled;
    const std::u16string name = unit::name(record);
    const std::u16string unitPath = joinUnitPath(folderPath, name);
    std::u16string fileName, streamName;
    if (splitStreamName(name, fileName, streamName)) {
        if (m_mode == 4) return kOk;
        return extractStream(diskPathOfUnit(m_base, folderPath, fileName), record, fileName, streamName);
    }
    const std::string target = diskPathOfUnit(m_base, folderPath, name);
    if ((unit::attributes(record) & kAttrFolder) != 0) {
        if (m_mode == 4) {
            if (fs::isDirectory(target)) return extractFolder(record, folderPath, target);
            return askRemoval(Msg::kImportLacksSubfolder, {target, name, unitPath}, 5, record, folderPath);
        }
        return extractFolder(record, folderPath, target);
    }
    DiskInfo disk;
    if (!diskInfo(target, disk)) {
        ++filesVisited;
        if (m_mode == 4) {
            if (folderPath.empty() && equalsIgnoreCase(name, u"AutoRun.inf")) return kOk;
            return askRemoval(Msg::kImportLacksFile, {target, name, unitPath}, 3, record, folderPath);
        }
        return extractToFile(target, record);
    }
    ++filesVisited;
    const uint64_t unitTime = unit::modified(record);
    bool diskLater = disk.modified > unitTime;
    const bool equal = disk.modified == unitTime;
    if (equal && disk.size != unit::size(record)) diskLater = true;
    if (m_mode == 4) return kOk;
    if (equal && !diskLater) {
        if ((m_mode & 2) == 0 && (m_mode & 4) == 0)
            m_archive.ui().progressLog(fromUtf8(target), msgText(Msg::kExternalSame));
        return kOk;
    }
    if (diskLater) {
        m_archive.ui().progressLog(fromUtf8(target), msgText(Msg::kExternalLater));
        if ((m_mode & 4) != 0) return kOk;
        int answer = 0;
        if (toAll[0]) answer = kAnswerYesAll;
        else if (toAll[1]) answer = kAnswerNoAll;
        else
            answer = m_archive.ui().askArchive(
                msgFormat(Msg::kExportDateEarly,
                          {Vaultora::formatFileTime(disk.modified), sizeText(disk.size), fromUtf8(target),
                           Vaultora::formatFileTime(unitTime), sizeText(unit::size(record)), u"\\" + unitPath}),
                msgText(Msg::kCaptionExportFile), mb::kRememberChoice);
        switch (answer) {
            case kAnswerYesAll: toAll[0] = true; break;
            case kAnswerYes: break;
            case kAnswerNoAll: toAll[1] = true; return kOk;
            case kAnswerNo: return kOk;
            case kAnswerCancel: return kCancelled;
            default: return kUnexpectedAnswer;
        }
    }
    return extractToFile(target, record);
}

Result cExtractFileActorBlock::extractFolder(uint8_t* record, std::u16string_view folderPath, const std::string& target) {
    if (m_mode != 4) {
        if (int err = makeFolders(target); err != 0 && !fs::isDirectory(target)) {
            m_archive.ui().message(msgFormat(Msg::kErrorCreatingDirectory, {fs::errorText(err), target}),
                                   msgText(Msg::kCaptionAttention), mb::kOk | mb::kIconError);
            return kWriteFailed;
        }
    }
    ++foldersVisited;
    const std::u16string path = joinUnitPath(folderPath, unit::name(record));
    if (progress.addFilesWindow) {
        m_archive.ui().addFilesEvent(0xAA01, 0);
        m_archive.ui().addFilesEvent(0xAA02, 0);
    }
    const uint32_t start = unit::start(record);
    if (unit::kind(record) == kUnitChain && start != 0 && start != kNoCluster) {
        if (Result rc = walk(m_archive, u"*", start, path, *this, nullptr); rc != kOk) return rc;
    }
    if (m_mode != 4) {
        // The folder's own times and permissions once its contents are in place.
        (void)setFileTimes(target, unit::accessed(record), unit::modified(record));
        if ((unit::attributes(record) & kAttrPosixMode) != 0) (void)applyAttributes(target, unit::attributes(record));
    }
    return kOk;
}

Result cExtractFileActorBlock::writeDataFile(const std::string& target, const uint8_t* record) {
    Interaction& ui = m_archive.ui();
    if (isLinkRecord(record)) {
        cExtractBuffer body;
        Result rc = extractUnitData(m_archive, body, record, progress);
        if (rc == kOk) {
            std::string link(body.data.begin(), body.data.end());
            if (int err = makeSymlink(link, target); err != 0) rc = kWriteFailed;
        }
        if (rc == kOk) {
            (void)setFileTimes(target, unit::accessed(record), unit::modified(record));
            ++filesExtracted;
            ui.progressLog(fromUtf8(target), msgText(Msg::kExtracted));
        } else {
            ui.progressLog(fromUtf8(target), msgFormat(Msg::kErrorCode, {static_cast<unsigned>(rc)}));
        }
        return rc;
    }
    // Never write through a link that happens to stand where the file goes.
    DiskInfo existing;
    if (diskInfo(target, existing) && existing.kind == DiskKind::kSymlink) fs::removeFile(target);
    File file;
    if (file.open(target, OpenMode::kCreateAlways) != 0) {
        const int answer = ui.message(msgFormat(Msg::kErrorExtracting, {fromUtf8(target)}),
                                      msgText(Msg::kCaptionAttention), mb::kYesNo);
        return answer == kAnswerNo ? kCancelled : kOk;
    }
    cExtractFile sink(&file);
    Result rc = extractUnitData(m_archive, sink, record, progress);
    if (rc == kOk && !file.sync()) rc = kFlushFailed;
    file.close();
    if (rc == kOk) {
        ui.progressLog(fromUtf8(target), msgText(Msg::kExtracted));
        (void)setFileTimes(target, unit::accessed(record), unit::modified(record));
        ++filesExtracted;
        (void)applyAttributes(target, unit::attributes(record));
    } else {
        ui.progressLog(fromUtf8(target), msgFormat(Msg::kErrorCode, {static_cast<unsigned>(rc)}));
    }
    return rc;
}

Result cExtractFileActorBlock::extractToFile(const std::string& target, const uint8_t* record) {
    if (isReadOnly(target)) {
        if (!readOnlyYesAll) {
            const int answer = m_archive.ui().askArchive(msgFormat(Msg::kReadOnlyTarget, {fromUtf8(target)}),
                                                         msgText(Msg::kCaptionAttention), mb::kRememberChoice);
            switch (answer) {
                case kAnswerYes: break;
                case kAnswerYesAll: readOnlyYesAll = true; break;
                case kAnswerNo: return kOk;
                case kAnswerCancel:
                case kAnswerNoAll: return kCancelled;
                default: return kUnexpectedAnswer;
            }
        }
        (void)makeWritable(target);
    }
    Result rc = writeDataFile(target, record);
    lastExtractedPath = target;
    return rc;
}

Result cExtractFileActorBlock::extractStream(const std::string& target, const uint8_t* record,
                                             const std::u16string& fileName, const std::u16string& streamName) {
    Interaction& ui = m_archive.ui();
    cExtractBuffer body;
    if (Result rc = extractUnitData(m_archive, body, record, progress); rc != kOk) return rc;
    const std::string attribute = diskNameFromUnit(streamName);
    // A read-only file refuses new attributes: lift the write bit for the moment.
    DiskInfo before;
    const bool readOnly = diskInfo(target, before) && isReadOnly(target);
    if (readOnly) (void)makeWritable(target);
    int err = writeStream(target, attribute, body.data.data(), body.data.size());
    if (readOnly) (void)applyAttributes(target, before.attributes);
    const std::string shown = target + ":" + attribute;
    if (err == 0) {
        ui.progressLog(fromUtf8(shown), msgText(Msg::kExtracted));
        ++filesExtracted;
        return kOk;
    }
    if (!streamsUnsupported(err)) {
        const int answer = ui.message(msgFormat(Msg::kErrorExtracting, {fromUtf8(shown)}), msgText(Msg::kCaptionAttention),
                                      mb::kYesNo);
        return answer == kAnswerNo ? kCancelled : kOk;
    }
    // The target cannot hold the stream: offer it as a file of its own.
    std::u16string separate = fileName + u"_" + streamName;
    const size_t slash = target.find_last_of('/');
    const std::string folder = slash == std::string::npos ? "." : target.substr(0, slash);
    std::string separateName = diskNameFromUnit(separate);
    for (size_t i = diskNameFromUnit(fileName).size(); i < separateName.size(); ++i)
        if (separateName[i] == ':') separateName[i] = '_';
    int answer = streamAnswer;
    if (answer != kAnswerNoAll && answer != kAnswerYesAll) {
        answer = ui.askArchive(msgFormat(Msg::kStreamQuestionExtract,
                                         {fileName, streamName, fromUtf8(separateName), fromUtf8(folder)}),
                               msgText(Msg::kCaptionAttention), mb::kRememberChoice);
        streamAnswer = answer;
    }
    if (answer == kAnswerCancel) return kCancelled;
    if (answer == kAnswerNo || answer == kAnswerNoAll) return kOk;
    const std::string path = folder + "/" + separateName;
    File file;
    if (file.open(path, OpenMode::kCreateAlways) != 0) {
        const int again = ui.message(msgFormat(Msg::kErrorExtracting, {fromUtf8(path)}), msgText(Msg::kCaptionAttention),
                                     mb::kYesNo);
        return again == kAnswerNo ? kCancelled : kOk;
    }
    Result rc = body.data.empty() || file.writeAt(0, body.data.data(), body.data.size()) ? kOk : kWriteFailed;
    if (rc == kOk && !file.sync()) rc = kFlushFailed;
    file.close();
    if (rc == kOk) {
        (void)setFileTimes(path, unit::accessed(record), unit::modified(record));
        ++filesExtracted;
        ui.progressLog(fromUtf8(path), msgText(Msg::kExtracted));
    }
    lastExtractedPath = path;
    return rc;
}

Result cExtractFileActorBlock::afterCluster(ChainBuffer& buffer) {
    if (progress.addFilesWindow) m_archive.ui().addFilesEvent(0xAA04, buffer.data.size());
    return squeezeAndWrite(m_archive, buffer);
}

}  // namespace vaultora
