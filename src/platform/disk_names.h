#pragma once
// Names on a Linux disk and names of units inside an archive.
//
// A Linux name is a byte string; a unit name is UTF-16. The way in decodes UTF-8 and turns every
// byte that is not part of valid UTF-8 into the lone surrogate U+DC80+byte, so every Linux name
// comes back byte for byte. The characters \ : * ? " < > | may appear in a Linux name but have
// a meaning inside the archive (separator, stream mark, wildcards), so they travel as the
// private-use characters U+F000 + their code point and are turned back on extraction.
#include <string>
#include <string_view>

namespace vaultora {

// Disk name (one path component) -> unit name.
std::u16string unitNameFromDisk(std::string_view diskName);
// Unit name (one component, no stream part) -> disk name.
std::string diskNameFromUnit(std::u16string_view unitName);

// A unit name of the form "file:stream:$DATA" names a stream of "file". The first colon of a
// name is always the stream mark: colons of disk names are carried as U+F03A.
bool isStreamName(std::u16string_view name);
// Splits a stream unit name into the file part and the stream part (without the leading colon
// and the ":$DATA" suffix). False for ordinary names.
bool splitStreamName(std::u16string_view name, std::u16string& file, std::u16string& stream);
// The unit name of stream `streamDiskName` (an extended attribute name without "user.") of
// the file whose unit name is `fileUnitName`.
std::u16string streamUnitName(std::u16string_view fileUnitName, std::string_view streamDiskName);

}  // namespace vaultora
