#include "platform/messages.h"

#include <map>
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

std::u16string msgFormat(Msg id, std::initializer_list<FormatArg> args) {
    return formatText(msgText(id), args);
}

void setMessageTranslator(MessageTranslator t) {
    std::lock_guard<std::mutex> lock(g_mutex);
    g_translator = std::move(t);
}

}  // namespace vaultora
