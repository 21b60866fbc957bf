#include "archive/walk.h"

#include <algorithm>
#include <cstring>

#include "archive/directory.h"
#include "crypto/sym_alg_table.h"
#include "platform/disk_names.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

Result enumerateDirectory(ChainBuffer& buffer, std::u16string_view pattern, std::u16string_view folderPath,
                          cActorBlock& actor, const SelectionList* selection) {
    for (int pass = 0; pass < 2; ++pass) {
        const bool streams = pass == 1;
        for (size_t off = 0; off + kUnitFixedSize <= buffer.data.size();) {
            uint8_t* r = buffer.data.data() + off;
            if (!unit::valid(r, buffer.data.size() - off)) return kInconsistent;
            const uint32_t length = unit::length(r);
            if (unit::kind(r) != kUnitVolume && unit::kind(r) != kUnitDeleted) {
                const std::u16string name = unit::name(r);
                if (isStreamName(name) == streams && wildcardMatch(pattern, name)) {
                    bool selected = selection == nullptr;
                    if (!selected) {
                        const std::u16string path = joinUnitPath(folderPath, name);
                        selected = std::find(selection->begin(), selection->end(), path) != selection->end();
                    }
                    if (selected) {
                        if (Result rc = actor.actOnUnit(r, folderPath); rc != kOk) return rc;
                    }
                }
            }
            off += length;
        }
    }
    return kOk;
}

Result walk(Vaultora& a, std::u16string_view pattern, uint32_t chainStart, std::u16string_view folderPath,
            cActorBlock& actor, const SelectionList* selection) {
    if (chainStart >= a.cot().size()) return kInconsistent;
    uint32_t c = chainStart;
    Result last = kOk;
    for (size_t steps = 0;; ++steps) {
        ChainBuffer buffer;
        buffer.cluster = c;
        if (Result rc = a.readCluster(buffer); rc != kOk) return rc;
        Result rc = enumerateDirectory(buffer, pattern, folderPath, actor, selection);
        if (rc != kOk) {
            if (rc == kCancelled) (void)actor.afterCluster(buffer);
            return rc;
        }
        last = actor.afterCluster(buffer);
        if (last != kOk) return last;
        const uint32_t next = a.nextCluster(c);
        if (next == c || steps > a.cot().size()) return kInconsistent;
        if (next == kEndOfChain) return last;
        if (next == 0 || next >= a.cot().size()) return kInconsistent;
        c = next;
    }
}

Result walkPath(Vaultora& a, std::u16string_view path, cActorBlock& actor) {
    std::u16string folder, name;
    splitUnitPath(path, folder, name);
    if (name.empty()) name = u"*";
    uint32_t c = 0;
    if (Result rc = resolveFolder(a, folder, c); rc != kOk) return rc;
    if (c == kNoCluster) return kNotFound;
    return walk(a, name, c, folder, actor, nullptr);
}

bool cExtractFile::write(const uint8_t* bytes, size_t length, size_t& written) {
    written = 0;
    if (m_file == nullptr || !m_file->writeAt(m_position, bytes, length)) return false;
    m_position += length;
    written = length;
    return true;
}

bool cExtractMemFile::write(const uint8_t* bytes, size_t length, size_t& written) {
    const uint64_t room = m_capacity - m_count;
    const size_t n = static_cast<size_t>(std::min<uint64_t>(length, room));
    if (n != 0) std::memcpy(m_destination + m_count, bytes, n);
    m_count += n;
    written = n;
    return true;
}

bool cExtractBuffer::write(const uint8_t* bytes, size_t length, size_t& written) {
    data.insert(data.end(), bytes, bytes + length);
    written = length;
    return true;
}

Result extractUnitData(Vaultora& a, cExtractFile& sink, const uint8_t* record, const WalkProgress& progress) {
    Interaction& ui = a.ui();
    const std::u16string name = unit::name(record);
    if (progress.addFilesWindow) {
        ui.addFilesEvent(0xAA03, 0);
    } else {
        ui.progressTitle(msgText(Msg::kExtractFileTitle));
        ui.progressStatus(name);
        ui.progressPercent(0);
    }
    if (unit::kind(record) == kUnitInline) {
        const uint32_t start = unit::start(record), length = unit::length(record);
        if (start > length) return kInconsistent;
        size_t written = 0;
        if (!sink.write(record + start, length - start, written) || written != length - start) return kWriteFailed;
        if (!progress.addFilesWindow) ui.progressPercent(100);
        return kOk;
    }
    uint32_t c = unit::start(record);
    if (c == 0 || c == kNoCluster) return kOk;
    const uint64_t total = unit::size(record);
    uint64_t done = 0;
    int lastPercent = 0;
    for (size_t steps = 0; c != kEndOfChain; ++steps) {
        if (c >= a.cot().size() || steps > a.cot().size()) return kInconsistent;
        ChainBuffer buffer;
        buffer.cluster = c;
        if (Result rc = a.readCluster(buffer); rc != kOk) return rc;
        size_t written = 0;
        if (!sink.write(buffer.data.data(), buffer.data.size(), written) || written != buffer.data.size())
            return kWriteFailed;
        done += buffer.data.size();
        if (progress.addFilesWindow) {
            ui.addFilesEvent(0xAA04, buffer.data.size());
        } else if (total != 0) {
            const int percent = static_cast<int>(std::min<uint64_t>(done * 100 / total, 100));
            if (percent != lastPercent) ui.progressPercent(lastPercent = percent);
        }
        const uint32_t next = a.nextCluster(c);
        if (next == c || next == 0) return kInconsistent;
        c = next;
    }
    return kOk;
}

Result extractToMemory(Vaultora& a, uint8_t* destination, std::u16string_view path, uint64_t capacity) {
    SecureBytes copy;
    if (Result rc = findUnitByPath(a, path, copy); rc != kOk) return rc;
    cExtractMemFile sink(destination, capacity);
    return extractUnitData(a, sink, copy.data());
}

Result readRecordBody(Vaultora& a, const uint8_t* record, SecureBytes& buffer) {
    if (unit::kind(record) == kUnitInline) {
        const uint32_t start = unit::start(record), length = unit::length(record);
        if (start > length) return kInconsistent;
        buffer.insert(buffer.end(), record + start, record + length);
        return kOk;
    }
    const uint32_t start = unit::start(record);
    if (start == 0 || start == kNoCluster) return kOk;
    for (uint32_t c : a.chainClusters(start)) {
        ChainBuffer b;
        b.cluster = c;
        if (Result rc = a.readCluster(b); rc != kOk) return rc;
        try {
            buffer.insert(buffer.end(), b.data.begin(), b.data.end());
        } catch (const std::bad_alloc&) {
            return kNoMemory;
        }
    }
    return kOk;
}

Result readUnitIntoBuffer(Vaultora& a, std::u16string_view path, SecureBytes& buffer) {
    SecureBytes copy;
    if (Result rc = findUnitByPath(a, path, copy); rc != kOk) return rc;
    if (unit::kind(copy.data()) == kUnitInline) return readInlineUnit(a, path, buffer);
    return readRecordBody(a, copy.data(), buffer);
}

namespace {

class cFindNextActorBlock : public cActorBlock {
public:
    cFindNextActorBlock(std::u16string_view reference, const UnitFilter& filter, bool after)
        : m_reference(reference), m_filter(filter), m_after(after) {}
    Result actOnUnit(uint8_t* record, std::u16string_view) override {
        const std::u16string name = unit::name(record);
        if (m_filter && !m_filter(name)) return kOk;
        const bool isReference = equalsIgnoreCase(name, m_reference);
        if (!m_after) {
            if (isReference) {
                if (!m_haveResult) { result = name; m_haveResult = true; }
                return kOwnerFound;
            }
            result = name;
            m_haveResult = true;
            return kOk;
        }
        if (m_passed) {
            result = name;
            return kOwnerFound;
        }
        if (isReference) {
            m_passed = true;
            result = name;  // the reference itself when it is the last one
        }
        return kOk;
    }
    std::u16string result;

private:
    std::u16string m_reference;
    const UnitFilter& m_filter;
    bool m_after;
    bool m_passed = false;
    bool m_haveResult = false;
};

class cGetSizesActor : public cActorBlock {
public:
    cGetSizesActor(Vaultora& a, SizeCount& count) : m_archive(a), m_count(count) {}
    Result actOnUnit(uint8_t* record, std::u16string_view folderPath) override {
        const uint8_t kind = unit::kind(record);
        if ((unit::attributes(record) & kAttrFolder) != 0) {
            ++m_count.folders;
            if (kind != kUnitChain) return kInconsistent;
            const uint32_t start = unit::start(record);
            if (start == 0 || start == kNoCluster) return kOk;
            return walk(m_archive, u"*", start, joinUnitPath(folderPath, unit::name(record)), *this, nullptr);
        }
        ++m_count.files;
        if (kind == kUnitInline) return kOk;
        if (kind != kUnitChain) return kInconsistent;
        const uint32_t start = unit::start(record);
        if (start == 0 || start == kNoCluster) return kOk;
        m_count.realSize += unit::size(record);
        for (uint32_t c : m_archive.chainClusters(start)) m_count.compressedSize += m_archive.cot()[c].size;
        return kOk;
    }
    Result afterCluster(ChainBuffer& buffer) override {
        m_count.realSize += buffer.data.size();
        if (buffer.cluster < m_archive.cot().size()) m_count.compressedSize += m_archive.cot()[buffer.cluster].size;
        return kOk;
    }

private:
    Vaultora& m_archive;
    SizeCount& m_count;
};

}  // namespace

Result findAdjacentUnit(Vaultora& a, std::u16string& out, std::u16string_view folderPath, std::u16string_view reference,
                        const UnitFilter& filter, bool after) {
    uint32_t c = 0;
    if (Result rc = resolveFolder(a, folderPath, c); rc != kOk) return rc;
    cFindNextActorBlock actor(reference, filter, after);
    Result rc = walk(a, u"*", c, folderPath, actor, nullptr);
    if (rc != kOk && rc != kOwnerFound) return rc;
    if (actor.result.empty()) return kNotFound;
    out = actor.result;
    return kOk;
}

bool searchUnitContent(Vaultora& a, const uint8_t* record, const uint8_t* pattern, size_t patternLength) {
    if (patternLength == 0) return true;
    auto contains = [&](const uint8_t* data, size_t n) {
        return n >= patternLength && std::search(data, data + n, pattern, pattern + patternLength) != data + n;
    };
    if (unit::kind(record) == kUnitInline) {
        const uint32_t start = unit::start(record), length = unit::length(record);
        return start <= length && contains(record + start, length - start);
    }
    const uint32_t start = unit::start(record);
    if (start == 0 || start == kNoCluster) return false;
    // The last patternLength-1 bytes of one cluster are joined with the next cluster, so an
    // occurrence that spans the boundary is found.
    SecureBytes window;
    for (uint32_t c : a.chainClusters(start)) {
        ChainBuffer b;
        b.cluster = c;
        if (a.readCluster(b) != kOk) return false;
        window.insert(window.end(), b.data.begin(), b.data.end());
        if (contains(window.data(), window.size())) return true;
        const size_t keep = std::min(window.size(), patternLength - 1);
        window.erase(window.begin(), window.end() - static_cast<long>(keep));
    }
    return false;
}

Result countSizes(Vaultora& a, uint32_t chainStart, SizeCount& out) {
    cGetSizesActor actor(a, out);
    return walk(a, u"*", chainStart, u"", actor, nullptr);
}

Result showArchiveStatistics(Vaultora& a, std::u16string& text, std::u16string& caption) {
    SizeCount count;
    if (Result rc = countSizes(a, 0, count); rc != kOk) return rc;
    const Header& h = a.header();
    const uint64_t compressed = static_cast<uint64_t>(h.embeddedOffset) + h.dataOffset + h.cotLength + count.compressedSize;
    const unsigned ratio = count.realSize == 0 ? 0u : static_cast<unsigned>(count.compressedSize * 100 / count.realSize);
    const char* cipherName = a.recordCipher().hasCipher() ? SymAlgName(a.cipherId()) : nullptr;
    const std::u16string name = cipherName != nullptr ? fromUtf8(cipherName) : std::u16string(msgText(Msg::kCipherUndefined));
    const std::u16string algorithm =
        msgFormat(Msg::kAlgorithmBits, {name, static_cast<unsigned>(a.archiveKey().size() * 8)});
    text = msgFormat(Msg::kArchiveStatistics, {fromUtf8(a.path()), algorithm, count.files, count.folders,
                                               sizeText(count.realSize), sizeText(compressed), ratio});
    text += u'\n';
    text += msgFormat(Msg::kFileFormatVersion, {static_cast<unsigned>(h.versionMajor), static_cast<unsigned>(h.versionMinor)});
    caption = msgText(Msg::kArchiveStatisticCaption);
    return kOk;
}

std::u16string sizeText(uint64_t bytes) {
    static const Msg kUnits[] = {Msg::kSizeUnitB, Msg::kSizeUnitKB, Msg::kSizeUnitMB, Msg::kSizeUnitGB, Msg::kSizeUnitTB};
    uint64_t value = bytes;
    unsigned digit = 0, divisions = 0;
    bool inexact = false;
    while (value >= 1024 && divisions < 4) {
        const uint64_t r = value % 1024;
        digit = static_cast<unsigned>(((r * 100 / 1024) + 5) / 10);
        if (r != 0) inexact = true;
        value /= 1024;
        ++divisions;
    }
    if (inexact && digit == 10) {
        ++value;
        digit = 0;
    }
    std::string number = std::to_string(value);
    if (inexact) number += "." + std::to_string(digit);
    return fromUtf8(number) + u" " + std::u16string(msgText(kUnits[divisions]));
}

}  // namespace vaultora
