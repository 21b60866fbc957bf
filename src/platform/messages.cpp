#include "platform/messages.h"

#include <algorithm>
#include <map>
#include <vector>
#include <mutex>

namespace vaultora {

namespace {

struct Entry {
    Msg id;
    const char16_t* text;
};

const Entry kTable[] = {
    {Msg::kCaptionVaultora, u"Vaultora"},
    {Msg::kCaptionAttention, u"Attention!"},
    {Msg::kCaptionError, u"Vaultora Error"},
    {Msg::kFileAlreadyExists, u"File '%s'\nAlready exists!"},
    {Msg::kErrorCompacting, u"Error %d  in compacting archive."},
    {Msg::kCaptionCompacting, u"Compacting"},
    {Msg::kCrosslinkNoUnit, u"Cannot find directory entry of crosslinked clusters"},
    {Msg::kCrosslinksDetected, u"Cross links are detected"},
    {Msg::kCrosslinkQuestion,
     u"Directory unit 1 : %s\nDirectory unit 2 : %s\nare crosslinked.\nOne of them has to be deleted.\n\nPress Yes "
     u"button to delete directory unit 1\nPress No  button to delete directory unit 2"},
    {Msg::kCompactingSpaceUnit, u"Compacting space unit %d"},
    {Msg::kCompactingLastSpaceUnit, u"Compacting last space unit %d"},
    {Msg::kCreatingUsedSpaceList, u"Creating used space list"},
    {Msg::kCompactingArchive, u"Compacting archive"},
    {Msg::kExtendedKeyBlockCorrupted, u"Extended key block is corrupted\nArchive name '%s'"},
    {Msg::kPasswordInvalid, u"The password you entered is invalid"},
    {Msg::kClusterLost,
     u"Cluster information is lost!\nCluster number %d\nTotal clusters %d\n\nDo you want to skip the cluster and "
     u"continue reading?"},
    {Msg::kErrorSettingFilePointer, u"Error in setting file pointer"},
    {Msg::kSeekErrorDetail, u"Cluster %X, \nOffset %X %X\nFile: '%s'"},
    {Msg::kWritingClusterFile, u"Writing cluster file %d to archive"},
    {Msg::kMasterKeyCopyExists,
     u"Master key block copy exists in temporary directory.\nPress Yes button to use the temporary copy to open "
     u"archive\nOr press No button to use archive internal master key block."},
    {Msg::kWriteMasterKeyBack, u"Do you want to write temporary master key block back to archive?"},
    {Msg::kErrorCreatingDirectory, u"Error '%s' in creating directory.\nPath: '%s'"},
    {Msg::kErrorNumber, u"Error number %d"},
    {Msg::kErrorNote, u"Error %d, File %s, line %d"},
    {Msg::kInvalidTime, u"Invalid"},
    {Msg::kOpenVersionOld,
     u"Application version is old for the archive.\nPlease download the latest version of Vaultora from the "
     u"maker's download page."},
    {Msg::kOpenInUse,
     u"Error in opening archive\nFile name: '%s'\nThe process cannot access the file because \nit is being used by "
     u"another process."},
    {Msg::kOpenWriteError,
     u"Error in writing archive\nFile name: '%s'\nPlease check if you have write access to the folder."},
    {Msg::kOpenSecretKeyMissing, u"Corresponding secret key was not found in data base"},
    {Msg::kOpenError, u"Error %d  in opening archive."},
    {Msg::kUsageText,
     u"\n"
     u"Vaultora command line usage.\n"
     u"\n"
     u"1. Open existing archive.\n"
     u"\n"
     u"        >Vaultora Open <archive name>\n"
     u"\n"
     u"2. Add file/folder to archive\n"
     u"\n"
     u"        >Vaultora Add <archive name> <file/folder/@*listFile name> [ -PKID publicKeyID ]\n"
     u"\n"
     u"        Note, @* - prefix before list file name,\n"
     u"        ( '*' means delete the list file when process finishes )\n"
     u"        See Options: -PKID below.\n"
     u"\n"
     u"3. Extract specified files\n"
     u"\n"
     u"        >Vaultora Extract <archive name> < destination folder name> [ file pattern list ... ]\n"
     u"\n"
     u"        Sample: >Vaultora Extract \"C:\\My archive.vra\" C:\\tmp *.txt\n"
     u"        All txt files will be extracted from \"C:\\My archive.vra\" to C:\\tmp folder.\n"
     u"        \n"
     u"        Note, file name pattern may contain * or % symbols\n"
     u"                % means any single symbol is allowed\n"
     u"                * means any symbols is allowed \n"
     u"                Sample: \"qwerty\" is compatible \"q%e*y*\".\n"
     u"\n"
     u"\n"
     u"4. Send file.\n"
     u"    Chooses public key user ( or uses the defined by PKID ),\n"
     u"    encrypts files by public key and sends them to the user\n"
     u"\n"
     u"        >Vaultora Send   <file/folder name> [ -PKID publicKeyID ]\n"
     u"        See Options -PKID:\n"
     u"\n"
     u"5. Make self extracted file .EXE from existing .VRA archive\n"
     u"\n"
     u"        >MakeSelfExtracted  <archive name> [ new exe path ] [ -LF logFileName ]\n"
     u"\n"
     u"6. Show local database public key identifiers.\n"
     u"\n"
     u"        >Vaultora ShowPKID\n"
     u"\n"
     u"\n"
     u"Options:\n"
     u"\t-PKID publicKeyID\n"
     u"      If public key identifier (-PKID) is specified, it creates new archive encrypted by the public key.\n"
     u"      Note, the public key has to be added to local database. Use 'Manage Key Database' menu in Vaultora.\n"
     u"      Use the 'ShowPKID' command to view existing public keys.\n"
     u"      You may define several -PKID parameters to add required public key.\n"
     u"\n"
     u"   -LF logFileName\n"
     u"      Writes messages to the file in batch mode.\n"
     u"\n\n"},
    {Msg::kUsageCaption, u"Usage"},
    {Msg::kNotAvailableYet, u"not available yet"},
    {Msg::kInvalidArgument, u"Invalid argument"},
    {Msg::kPasswordAlreadyUsed, u"The same password was already used for the archive."},
    {Msg::kArchiveNotEncrypted, u"The archive is not encrypted."},
    {Msg::kEnterPasswordToRemove, u"Enter password to be removed."},
    {Msg::kSessionKeyNotFound, u"Session key encrypted by the password was not found."},
    {Msg::kExtendedKeyBlockEmpty, u"Extended key block is empty."},
    {Msg::kPasswordOpensMasterKey,
     u"The password you entered is compatible with Master Key,\nMaster Key block cannot be removed."},
    {Msg::kExtendedKeyBlockCorruptedAdd,
     u"The extended key block is corrupted!\nArchive name '%s'\nDo you want to clear the corrupted block content "
     u"and \nadd the new encrypted session key?"},
    {Msg::kEnterNewPassword, u"Enter new password"},
    {Msg::kEncryptionParameters, u"Encryption parameters"},
    {Msg::kPasswordEmpty, u"Password is empty"},
    {Msg::kPasswordTooShort, u"Password length is too short"},
    {Msg::kPasswordsMismatch, u"Passwords mismatch"},
    {Msg::kInvalidSalt, u"Invalid salt value"},
    {Msg::kKeyBlockCreatingTitle, u"Vaultora: Please wait for key block creating"},
    {Msg::kKeyBlockArchiveName, u"Archive name: '%s'"},
    {Msg::kErrorWritingNoSpace,
     u"Error in writing file.\n\nFile  '%s'\ncannot be added to archive  '%s'\nbecause there is not enough space on "
     u"the disk.\n\nPlease free additional space on the drive and use the Retry button to add the file.\nOr use the "
     u"Ignore button to skip the file."},
    {Msg::kErrorReadingRetry,
     u"Error in reading file\n '%s'.\n\nThe file may be busied by an application,\nplease close the application and "
     u"press the Retry button read the file again.\nUse the Ignore button to skip the file and continue the "
     u"operation."},
    {Msg::kFileOverFolder, u"You are copying file \n%s to archive.\nBut the archive contains a directory with same name."},
    {Msg::kCaptionAddFile, u"Add File"},
    {Msg::kStreamQuestionAdd,
     u"Vaultora has encountered an NTFS file system Alternate Data Stream\n '%s'\nin the file\n '%s'\n\nNote to user: "
     u"Alternate Data Streams are only supported on Windows NTFS file systems.\n\nDo you want to copy this Alternate "
     u"Data Stream into the archive?"},
    {Msg::kArchiveContainsFile, u"The archive already contains file\n%s\n\nOverwrite existing file?"},
    {Msg::kProcessTerminate,
     u"Process %s will be terminated.\nPress Yes button to confirm termination.\nPress No button to continue the "
     u"process."},
    {Msg::kInputDataCorrupted, u"Input data is corrupted"},
    {Msg::kCaptionExportFile, u"Export file"},
    {Msg::kCaptionImportFile, u"Import file"},
    {Msg::kAddFilesToArchive, u"Add files to archive"},
    {Msg::kExtractFileTitle, u"Extract file from archive"},
    {Msg::kArchiveStatistics,
     u"Archive %s\nEncryption algorithm: %s\nFiles %d\nFolders %d\nReal size %s\nCompressed size %s\nRatio %d%%"},
    {Msg::kFileFormatVersion, u"File format v.%d.%d"},
    {Msg::kAlgorithmBits, u"%s %d bits"},
    {Msg::kCipherUndefined, u"Undefined"},
    {Msg::kArchiveStatisticCaption, u"Archive statistic"},
    {Msg::kDiskFileExists, u"File %s\nalready exists.\n\nOverwrite existing file?"},
    {Msg::kRemoveFromArchive,
     u"File/folder '%s'\nwill be removed from archive.\n\nPress Cancel button to terminate the operation.\nPress No "
     u"button to skip removing the file.\nPress Yes button to confirm removing.\n"},
    {Msg::kImportLacksSubfolder,
     u"Import folder '%s'\ndoes not contain subfolder'%s'\nDo you want to remove subfolder '%s' from archive?"},
    {Msg::kImportLacksFile, u"Import folder '%s'\ndoes not contain file '%s'\nDo you want to remove file '%s' from archive?"},
    {Msg::kExternalSame, u"External version is same"},
    {Msg::kExternalLater, u"External version is later"},
    {Msg::kExportDateEarly,
     u"Exported file date is early than date of file on disk.\nFile on disk:\n Date: %s, Size: %s, Path: '%s'\nFile in "
     u"archive:\n Date: %s, Size: %s, Path: '%s'\n\nDo you want to overwrite file on disk?"},
    {Msg::kReadOnlyTarget, u"File '%s'\nis a read-only file.\n\nAre you sure you want to delete it?"},
    {Msg::kStreamQuestionExtract,
     u"Vaultora has encountered an NTFS file system Alternate Data Stream:\n '%s'\nin file:\n '%s'\nbut the "
     u"destination file system does not support Alternate Data Streams.\n\nDo you want to extract this stream as a "
     u"separate non-ADS file:\n '%s'\nto destination folder:\n '%s'?"},
    {Msg::kErrorExtracting, u"Error in extracting file\n '%s'\n\nDo you want to continue extracting?"},
    {Msg::kExtracted, u"extracted"},
    {Msg::kErrorCode, u"Error %d"},
    {Msg::kSizeUnitB, u"B"},
    {Msg::kSizeUnitKB, u"KB"},
    {Msg::kSizeUnitMB, u"MB"},
    {Msg::kSizeUnitGB, u"GB"},
    {Msg::kSizeUnitTB, u"TB"},
    {Msg::kSourceNotFound, u"Source file not found - "},
    {Msg::kErrorReadingSkipped, u"Error in reading file '%s'. File is skipped!"},
    {Msg::kFileSkippedCollected, u"File '%s' is skipped"},
    {Msg::kErrorReadingDirectory, u"Error in reading directory"},
    {Msg::kArchiveLacksExported, u"Archive does not contains exported file"},
    {Msg::kExportedNotInArchive, u"Exported file '%s'\nis not found in archive.\n\nDo you want to delete file on disk?"},
    {Msg::kExportedWiped, u"Exported file is wiped."},
    {Msg::kExportedWipeSkipped, u"Exported file wipipng is skipped."},
    {Msg::kArchiveLatest, u"Archive contains latest version"},
    {Msg::kImportDateEarly,
     u"Imported file date is early than date of file in archive.\nFile on disk:\n Date: %s, Size: %s, Path: '%s'\nFile "
     u"in archive:\n Date: %s, Size: %s, Path: '%s'\n\nDo you want to overwrite archive file?"},
    {Msg::kSameBodySkipped, u"File inside archive has same body as source file '%s'. File is skipped."},
    {Msg::kSkipped, u"Skipped"},
    {Msg::kAdded, u"added"},
    {Msg::kHeldForWriting, u"File '%s' is opened for write access by other applicaton."},
    {Msg::kHeldWrittenAnyway, u" Is written to archive."},
    {Msg::kHeldWriteAnyway, u"\n\nDo you want to write this file anyway?"},
    {Msg::kCaptionWarning, u"Warning!"},
    {Msg::kVersionUndefined, u"Undefined"},
    {Msg::kArchiveByPublicKey, u"Archive cannot be opened by public key."},
    {Msg::kVersionCaption, u"Version"},
    {Msg::kAddFileToArchive, u"Add file '%s' to archive '%s'"},
    {Msg::kNoError, u"No error!"},
    {Msg::kErrorWritingLog, u"Error in writting log file"},
    {Msg::kRememberChoice, u"Remember choice."},
    {Msg::kButtonOk, u"&OK"},
    {Msg::kButtonCancel, u"&Cancel"},
    {Msg::kButtonAbort, u"&Abort"},
    {Msg::kButtonRetry, u"&Retry"},
    {Msg::kButtonIgnore, u"&Ignore"},
    {Msg::kButtonYes, u"&Yes"},
    {Msg::kButtonNo, u"&No"},
    {Msg::kButtonTryAgain, u"&Try Again"},
    {Msg::kButtonContinue, u"C&ontinue"},
    {Msg::kButtonYesAll, u"Yes &All"},
    {Msg::kButtonNoAll, u"N&o All"},
    {Msg::kTerminalChoose, u"%s [%s]: "},
    {Msg::kTerminalYesNo, u"%s (y/N): "},
    {Msg::kTerminalArchiveName, u"Archive name: %s"},
    {Msg::kTerminalPassword, u"Password: "},
    {Msg::kTerminalConfirmPassword, u"Confirm password: "},
    {Msg::kNoTerminalAnswer, u"No terminal to ask: \"%s\" answered %s"},
    {Msg::kNoTerminalPassword,
     u"No terminal to enter the password for '%s'; set VAULTORA_PASSWORD_FILE to give it from a file"},
    {Msg::kPasswordFileUnreadable, u"The password file '%s' (VAULTORA_PASSWORD_FILE) cannot be read: %s"},
    {Msg::kPasswordFileWrong, u"The password from the password file is not accepted: %s"},
    {Msg::kPublicKeyNotAvailable, u"Archives encrypted by public key: not available yet"},
    {Msg::kWordFolder, u"Folder"},
    {Msg::kWordFile, u"File"},
    {Msg::kCheckCrosslinkQuestion,
     u"The following units have crosslinks\n1) %s\\%s\n2) %s\\%s\nOnly one unit can exist in the archive.\nPress "
     u"Yes button to remove first unit.\nPress No  button to remove second unit.\n"},
    {Msg::kCaptionCheckArchive, u"Check Archive Content"},
    {Msg::kStartBeyondTable,
     u"Cluster chain of unit '%s\\%s'\nhas start cluster %X it is more then max cluster %X\nThe unit will be deleted"},
    {Msg::kNextBeyondTable,
     u"Cluster chain of unit '%s\\%s'\ncontents a next cluster %X more then table size %X\nThe cluster %X will be "
     u"marked as last"},
    {Msg::kLostChainQuestion,
     u"Cluster number %04X,\nCluster chain length %d.\n\nPress YES button to free the cluster chain.\nPress No  button "
     u"to save the chain on disk."},
    {Msg::kCaptionLostChain, u"Lost cluster chain is detected."},
    {Msg::kErrorStartingDialog, u"Error in starting dialog"},
    {Msg::kCheckingLostClusters, u"Checking lost clusters"},
    {Msg::kRecoverError, u"Error %d in recovering archive\n '%s'."},
    {Msg::kRecoverQuestion, u"Archive '%s'\nis damaged!\n\nDo you want to recover it?"},
    {Msg::kClustersRecovered, u"Clusters recovered %d, max cluster number %d"},
    {Msg::kRecoverTitle, u"Recover '%s'"},
    {Msg::kBodyMissing,
     u"%s body was not found inside the archive.\nUnit info:\n Name '%s'\n Cluster %d, size %s.\n\nDo you want to "
     u"remove the unit?"},
};

std::mutex g_mutex;
MessageTranslator g_translator;

}  // namespace

std::u16string_view msgText(Msg id) {
    {
        std::lock_guard<std::mutex> lock(g_mutex);
        if (g_translator) {
            thread_local std::u16string translated;
            if (g_translator(id, translated)) return translated;
        }
    }
    for (const Entry& e : kTable)
        if (e.id == id) return e.text;
    return u"";
}

std::vector<uint32_t> duplicateMessageIds() {
    std::vector<uint32_t> ids;
    for (const Entry& e : kTable) ids.push_back(static_cast<uint32_t>(e.id));
    std::sort(ids.begin(), ids.end());
    std::vector<uint32_t> dups;
    for (size_t i = 1; i < ids.size(); ++i)
        if (ids[i] == ids[i - 1] && (dups.empty() || dups.back() != ids[i])) dups.push_back(ids[i]);
    return dups;
}

std::u16string msgFormat(Msg id, std::initializer_list<FormatArg> args) {
    return formatText(msgText(id), args);
}

void setMessageTranslator(MessageTranslator t) {
    std::lock_guard<std::mutex> lock(g_mutex);
    g_translator = std::move(t);
}

}  // namespace vaultora
