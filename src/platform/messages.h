#pragma once
// The string table: every text the program shows, by number. Where a text has a number of its own
// that number is used; the others are numbered from 20000 up. All callers fetch texts through
// msgText/msgFormat, so a translation can later replace them in one place.
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <string>
#include <string_view>

#include "platform/text.h"

namespace vaultora {

enum class Msg : uint32_t {
    kCaptionVaultora = 55,          // "Vaultora"
    kCaptionAttention = 63,         // "Attention!"
    kCaptionError = 65,             // "Vaultora Error"
    kFileAlreadyExists = 162,       // "File '%s'\nAlready exists!"

    // Archive object
    kExtendedKeyBlockCorrupted = 20000,
    kPasswordInvalid,
    kClusterLost,
    kErrorSettingFilePointer,       // caption
    kSeekErrorDetail,
    kWritingClusterFile,
    kMasterKeyCopyExists,
    kWriteMasterKeyBack,
    kErrorCreatingDirectory,
    kErrorNumber,
    kErrorNote,                     // "Error %d, File %s, line %d"
    kInvalidTime,
    // Open results shown by the shell
    kOpenVersionOld,
    kOpenInUse,
    kOpenWriteError,
    kOpenSecretKeyMissing,
    kOpenError,
    // Command line
    kUsageText,
    kUsageCaption,
    kNotAvailableYet,
    kInvalidArgument,

    // Key blocks and passwords
    kPasswordAlreadyUsed,
    kArchiveNotEncrypted,
    kEnterPasswordToRemove,         // dialog title
    kSessionKeyNotFound,
    kExtendedKeyBlockEmpty,
    kPasswordOpensMasterKey,
    kExtendedKeyBlockCorruptedAdd,  // question: clear the block and add the new session key?
    kEnterNewPassword,              // dialog title
    kEncryptionParameters,          // dialog title
    kPasswordEmpty,
    kPasswordTooShort,
    kPasswordsMismatch,
    kInvalidSalt,
    kKeyBlockCreatingTitle,
    kKeyBlockArchiveName,

    // Directory tree, walks and extraction
    kErrorWritingNoSpace = 43,      // "Error in writing file.\n\nFile  '%s'..." (Retry/Ignore)
    kErrorReadingRetry = 44,        // "Error in reading file\n '%s'...." (Retry/Ignore)
    kFileOverFolder = 60,           // "You are copying file \n%s to archive...."
    kCaptionAddFile = 61,           // "Add File"
    kStreamQuestionAdd = 62,        // alternate data stream met while adding
    kArchiveContainsFile = 67,      // "The archive already contains file\n%s\n\nOverwrite existing file?"
    kProcessTerminate = 78,         // "Process %s will be terminated...."
    kInputDataCorrupted = 125,      // "Input data is corrupted"
    kCaptionExportFile = 221,       // "Export file"
    kCaptionImportFile = 222,       // "Import file"
    kAddFilesToArchive = 257,       // "Add files to archive"
    kExtractFileTitle = 20400,
    kArchiveStatistics,
    kFileFormatVersion,
    kAlgorithmBits,
    kCipherUndefined,
    kArchiveStatisticCaption,
    kDiskFileExists,                // "File %s\nalready exists.\n\nOverwrite existing file?"
    kRemoveFromArchive,
    kImportLacksSubfolder,
    kImportLacksFile,
    kExternalSame,
    kExternalLater,
    kExportDateEarly,
    kReadOnlyTarget,
    kStreamQuestionExtract,
    kErrorExtracting,
    kExtracted,
    kErrorCode,                     // "Error %d"
    kSizeUnitB,
    kSizeUnitKB,
    kSizeUnitMB,
    kSizeUnitGB,
    kSizeUnitTB,
    // Adding
    kSourceNotFound,
    kErrorReadingSkipped,
    kFileSkippedCollected,
    kErrorReadingDirectory,
    kArchiveLacksExported,
    kExportedNotInArchive,
    kExportedWiped,
    kExportedWipeSkipped,
    kArchiveLatest,
    kImportDateEarly,
    kSameBodySkipped,
    kSkipped,
    kAdded,
    kHeldForWriting,
    kHeldWrittenAnyway,
    kHeldWriteAnyway,
    kCaptionWarning,

    kFirstFree = 21000,  // later additions number from here
};

// The default-language text of a message ("" for an unknown number).
std::u16string_view msgText(Msg id);
// The text formatted printf-style with the arguments.
std::u16string msgFormat(Msg id, std::initializer_list<FormatArg> args);

// A translation hook: when set, it is asked first and may return a replacement text.
using MessageTranslator = std::function<bool(Msg id, std::u16string& out)>;
void setMessageTranslator(MessageTranslator t);

}  // namespace vaultora
