#pragma once
// The string table: every text the program shows, by number. Where a text has a number of its own
// that number is used; the others are numbered from 20000 up. All callers fetch texts through
// msgText/msgFormat, so a translation can later replace them in one place.
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <string>
#include <string_view>
#include <vector>

#include "platform/text.h"

namespace vaultora {

enum class Msg : uint32_t {
    kCaptionVaultora = 55,          // "Vaultora"
    kCaptionAttention = 63,         // "Attention!"
    kCaptionError = 65,             // "Vaultora Error"
    kFileAlreadyExists = 162,       // "File '%s'\nAlready exists!"
    // Compacting
    kErrorCompacting = 48,          // "Error %d  in compacting archive."
    kCaptionCompacting = 92,        // "Compacting"
    kCrosslinkNoUnit = 93,
    kCrosslinksDetected = 94,
    kCrosslinkQuestion = 95,
    kCompactingSpaceUnit = 96,
    kCompactingLastSpaceUnit = 97,
    kCreatingUsedSpaceList = 100,
    kCompactingArchive = 107,

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
    // Command-line verbs, batch log and terminal prompts
    kVersionUndefined = 112,        // "Undefined"
    kArchiveByPublicKey = 127,      // "Archive cannot be opened by public key."
    kVersionCaption = 161,          // "Version"
    kAddFileToArchive = 20600,      // "Add file '%s' to archive '%s'"
    kNoError,
    kErrorWritingLog,
    kRememberChoice,                // check box of the Yes/No/Cancel prompt
    kButtonOk,                      // button labels; '&' marks the key that answers
    kButtonCancel,
    kButtonAbort,
    kButtonRetry,
    kButtonIgnore,
    kButtonYes,
    kButtonNo,
    kButtonTryAgain,
    kButtonContinue,
    kButtonYesAll,
    kButtonNoAll,
    kTerminalChoose,                // "Answer %s [%s]: "
    kTerminalYesNo,                 // "(y/N)"
    kTerminalArchiveName,           // "Archive name: %s"
    kTerminalPassword,
    kTerminalConfirmPassword,
    kNoTerminalAnswer,
    kNoTerminalPassword,
    kPasswordFileUnreadable,
    kPasswordFileWrong,
    kPublicKeyNotAvailable,
    // Consistency check and recovery
    kWordFolder = 87,               // "Folder"
    kWordFile = 91,                 // "File"
    kCheckCrosslinkQuestion = 98,
    kCaptionCheckArchive = 99,      // "Check Archive Content"
    kStartBeyondTable = 101,
    kNextBeyondTable = 102,
    kLostChainQuestion = 103,
    kCaptionLostChain = 104,        // "Lost cluster chain is detected."
    kErrorStartingDialog = 105,
    kCheckingLostClusters = 106,    // status text and caption
    kRecoverError = 120,
    kRecoverQuestion = 121,
    kClustersRecovered = 122,
    kRecoverTitle = 123,
    kBodyMissing = 20750,           // "%s body was not found inside the archive...."

    kFirstFree = 21000,  // later additions number from here
};

// The default-language text of a message ("" for an unknown number).
std::u16string_view msgText(Msg id);
// The text formatted printf-style with the arguments.
std::u16string msgFormat(Msg id, std::initializer_list<FormatArg> args);

// Numbers that more than one entry of the table uses (two texts under one number would make the
// later one unreachable); empty when the table is sound.
std::vector<uint32_t> duplicateMessageIds();

// A translation hook: when set, it is asked first and may return a replacement text.
using MessageTranslator = std::function<bool(Msg id, std::u16string& out)>;
void setMessageTranslator(MessageTranslator t);

}  // namespace vaultora
