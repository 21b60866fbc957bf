#pragma once
// The verb "Properties": the archive version query of other programs.
//
// The request file holds the path of an archive as UTF-16 text (little-endian, with or without
// the byte-order mark FF FE; FE FF marks big-endian; text without any zero byte is taken as UTF-8).
// The answer replaces the request file: UTF-16LE text with the byte-order mark,
//     Version\r\n2.1\r\n            (the archive's format version, major.minor)
// or  Version\r\nUndefined          (no archive header found at that path).
// Exit codes: 0, 71 when the request file cannot be read, 76 when it holds no path, 69 when the
// answer cannot be written.
#include <cstdint>
#include <string>
#include <vector>

#include "app/cmdline.h"

namespace vaultora {

// The archive path of a request file's bytes ("" when there is none).
std::string decodeRequestPath(const std::vector<uint8_t>& bytes);
// The answer for the archive at `archivePath`.
std::vector<uint8_t> versionAnswer(const std::string& archivePath);
int answerVersionQuery(const std::string& requestFile);
int runProperties(const Invocation& call);

}  // namespace vaultora
