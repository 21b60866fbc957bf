#include "archive/remove.h"

#include "archive/directory.h"
#include "platform/messages.h"

namespace vaultora {

namespace {

// The subtree of a removed folder goes without further questions.
class SubtreeRemover : public cActorBlock {
public:
    explicit SubtreeRemover(Vaultora& a) : m_archive(a) {}
    Result actOnUnit(uint8_t* record, std::u16string_view folderPath) override {
        return removeUnitRecord(m_archive, record, folderPath);
    }
    Result afterCluster(ChainBuffer& buffer) override { return squeezeAndWrite(m_archive, buffer); }

private:
    Vaultora& m_archive;
};

}  // namespace

Result squeezeAndWrite(Vaultora& a, ChainBuffer& buffer) {
    const bool wasDirty = buffer.dirty;
    buffer.dirty = false;
    squeeze(buffer);
    if (!buffer.dirty && !wasDirty) return kOk;
    buffer.dirty = true;
    return a.writeDirectoryCluster(buffer, true);
}

Result removeUnitRecord(Vaultora& a, uint8_t* record, std::u16string_view folderPath) {
    const uint32_t start = unit::start(record);
    if ((unit::attributes(record) & kAttrFolder) != 0 && unit::kind(record) == kUnitChain && start != 0 &&
        start != kNoCluster) {
        SubtreeRemover sub(a);
        if (Result rc = walk(a, u"*", start, joinUnitPath(folderPath, unit::name(record)), sub, nullptr); rc != kOk)
            return rc;
    }
    if (unit::kind(record) != kUnitInline) {
        if (!a.freeChain(start)) return kInconsistent;
        unit::setStart(record, kNoCluster);
    }
    markDeleted(record);
    return kOk;
}

Result cRemoveFileActorBlock::actOnUnit(uint8_t* record, std::u16string_view folderPath) {
    if (!m_yesToAll) {
        const std::u16string path = std::u16string(folderPath) + u"\\" + unit::name(record);
        const int answer = m_archive.ui().askArchive(msgFormat(Msg::kRemoveFromArchive, {path}),
                                                     msgText(Msg::kCaptionAttention), mb::kRememberChoice);
        switch (answer) {
            case kAnswerCancel: return kCancelled;
            case kAnswerYesAll:
                m_yesToAll = true;
                if (m_callerFlag != nullptr) *m_callerFlag = false;
                break;
            case kAnswerYes: break;
            case kAnswerNo: return kSkippedByAnswer;
            case kAnswerNoAll: return kSkippedAllByAnswer;
            default: return kUnexpectedAnswer;
        }
    }
    return removeUnitRecord(m_archive, record, folderPath);
}

Result cRemoveFileActorBlock::afterCluster(ChainBuffer& buffer) { return squeezeAndWrite(m_archive, buffer); }

}  // namespace vaultora
