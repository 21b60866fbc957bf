#include "platform/disk_names.h"

#include "platform/text.h"

namespace vaultora {

namespace {

constexpr char16_t kPrivateBase = 0xF000;
constexpr std::u16string_view kReserved = u"\\:*?\"<>|";
constexpr std::u16string_view kDataSuffix = u":$DATA";

}  // namespace

std::u16string unitNameFromDisk(std::string_view diskName) {
    std::u16string name = fromUtf8(diskName);
    for (char16_t& c : name)
        if (kReserved.find(c) != std::u16string_view::npos) c = static_cast<char16_t>(kPrivateBase + c);
    return name;
}

std::string diskNameFromUnit(std::u16string_view unitName) {
    std::u16string name(unitName);
    for (char16_t& c : name) {
        if (c > kPrivateBase && c < kPrivateBase + 0x80) {
            const char16_t plain = static_cast<char16_t>(c - kPrivateBase);
            if (kReserved.find(plain) != std::u16string_view::npos) c = plain;
        }
    }
    return toUtf8(name);
}

bool isStreamName(std::u16string_view name) {
    const size_t colon = name.find(u':');
    if (colon == std::u16string_view::npos) return false;
    return name.substr(colon) != u"::$DATA";
}

bool splitStreamName(std::u16string_view name, std::u16string& file, std::u16string& stream) {
    if (!isStreamName(name)) return false;
    const size_t colon = name.find(u':');
    file.assign(name.substr(0, colon));
    std::u16string_view rest = name.substr(colon + 1);
    if (rest.size() >= kDataSuffix.size() && rest.substr(rest.size() - kDataSuffix.size()) == kDataSuffix)
        rest.remove_suffix(kDataSuffix.size());
    stream.assign(rest);
    return true;
}

std::u16string streamUnitName(std::u16string_view fileUnitName, std::string_view streamDiskName) {
    std::u16string name(fileUnitName);
    name += u':';
    name += unitNameFromDisk(streamDiskName);
    name += kDataSuffix;
    return name;
}

}  // namespace vaultora
