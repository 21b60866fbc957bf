#pragma once
// Result codes of the engine. Every engine operation returns one of these 32-bit codes; 0 is
// success and 83 always means "cancelled by the user". The numbers are part of the program's
// contract with scripts (exit codes) and with stored logs, so they never change.
#include <cstdint>

namespace vaultora {

enum Result : uint32_t {
    kOk = 0,
    kBufferTooSmallCrypto = 1,     // crypto: output buffer too small, needed size returned
    kCipherSizes = 24,             // cipher object refused GetSizes
    kCipherBuffers = 25,           // CFB/CBC buffers could not be allocated
    kNotBlockMultiple = 26,        // length not a multiple of the block size
    kUnknownCipher = 28,           // unknown cipher identifier
    kKeyBlock39 = 39,              // key block result (no matching packet in this mode)
    kWrongPassword = 51,           // wrong password / header check mismatch
    kCipherNoMemory = 53,          // out of memory while building a cipher
    kNotApplicable = 55,           // key block: secret key not found / packet not applicable
    kNotInline = 57,               // unit is not stored inline
    kUnitExists = 58,              // a unit of that name already exists in the folder
    kNoMemoryForRecord = 59,
    kDirReadFailed = 60,           // a directory cluster could not be read during a lookup
    kNotFound = 61,                // name not found
    kSourceAttributes = 62,        // attributes of a source file cannot be read
    kNoRoom = 63,                  // the directory cluster has no room for the record
    kNoMemory = 64,
    kBufferTooSmall = 65,
    kCompression = 66,
    kSeekFailed = 68,
    kWriteFailed = 69,
    kReadFailed = 70,
    kCannotOpen = 71,
    kInUse = 72,
    kFlushFailed = 73,
    kTempFolder = 75,
    kInconsistent = 76,
    kSizeAlignment = 77,
    kKeyBlockCorrupt = 79,
    kKeyBlockWrite = 81,
    kNoFreeCluster = 82,
    kCancelled = 83,
    kInvalidName = 84,
    kEncryptFailed = 87,
    kDecryptFailed = 88,
    kFormat1HeaderTooLong = 89,
    kClusterCopyWriteFailed = 90,  // the crash copy of a moved record could not be written
    kCotSaveFailed = 91,           // the table copy could not be saved during a record move
    kClusterCopyUnreadable = 92,
    kCotCopyFailed = 93,
    kCotCreateFailed = 94,
    kCotWriteFailed = 95,
    kCotFlushFailed = 96,
    kSignatureWriteFailed = 97,
    kNotArchive = 99,
    kNoSuchFile = 100,
    kBadRecord = 101,
    kTooFewArguments = 104,
    kNewerFormat = 109,
    kClusterWriteFailed = 111,
    kCotReadBackDiffers = 114,
    // Crypto layer: hashes, key derivation and key packets
    kUnknownHash = 22,             // unknown hash identifier
    kHashUnavailable = 23,         // hash operation not available
    kMissingOutput = 29,           // output buffer absent
    kRandomPoolEmpty = 35,         // random bytes could not be produced
    kPacketHeader = 36,            // bad packet tag, or old-format header/length past the buffer
    kPacketLength = 38,            // new-format packet length runs past the buffer
    kBadS2K = 40,                  // unreadable S2K specifier
    kUnknownS2KAlg = 48,           // unknown hash or cipher named inside an S2K specifier
    kZeroKeyLength = 52,           // key derivation asked for zero bytes
    // Directory tree, walks and adding
    kDirectoryUnusable = 74,       // a folder's directory cannot be read, or a unit cannot be removed
    kArchiveReadOnly = 103,        // the archive is open read-only
    kOwnerFound = 110,             // a walk found the unit it looked for and stops
    kSkippedByAnswer = 112,        // the user answered No (the item is skipped)
    kSkippedAllByAnswer = 113,     // the user answered No to all
    kUnexpectedAnswer = 115,       // an answer none of the branches expects
};

}  // namespace vaultora
