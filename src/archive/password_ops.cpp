#include "archive/password_ops.h"

#include "crypto/key_block.h"
#include "platform/messages.h"
#include "platform/text.h"

namespace vaultora {

namespace {

// The open archive's key as the key packet builders take it.
Result currentKey(Vaultora& a, ArchiveKey& key) {
    key.cipherId = a.cipherId();
    key.key = a.archiveKey();
    if (key.cipherId == 0) return kOk;
    return CreateSymAlg(key.cipherId, key.key.data(), static_cast<int32_t>(key.key.size()), key.cipher);
}

// Reads the extended key block; a damaged one is offered for clearing. `cleared` tells the caller
// that the user chose an empty block.
Result readExtended(Vaultora& a, SecureBytes& ext, bool& cleared) {
    cleared = false;
    if (!a.readExtendedKeyBlock(ext) || CheckExtendedKeyBlock(ext.data(), ext.size()) != kOk) {
        int answer = a.ui().message(msgFormat(Msg::kExtendedKeyBlockCorruptedAdd, {a.path()}),
                                    msgText(Msg::kCaptionVaultora), mb::kYesNo | mb::kIconWarning);
        if (answer != kAnswerYes) return kKeyBlockCorrupt;
        ext.clear();
        cleared = true;
    }
    return kOk;
}

// Reads both key blocks of an encrypted archive; an unencrypted one is only told so.
Result readBlocksOfEncrypted(Vaultora& a, SecureBytes& master, SecureBytes& ext, bool& encrypted) {
    encrypted = a.cipherId() != 0;
    if (!encrypted) {
        a.ui().message(msgText(Msg::kArchiveNotEncrypted), msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconWarning);
        return kOk;
    }
    bool cleared = false;
    if (Result rc = a.readMasterKeyBlock(master); rc != kOk) return rc;
    return readExtended(a, ext, cleared);
}

// Asks for a new password until one is given that the archive does not know yet.
Result askNewPassword(Vaultora& a, const SecureBytes& master, const SecureBytes& ext, PasswordRecord& pw) {
    const std::array<uint8_t, 68> image = a.header().encode();
    for (;;) {
        if (!a.ui().password(msgText(Msg::kEnterNewPassword), pw, true)) return kCancelled;
        PasswordPacketLocation where;
        Result rc = LocatePasswordPacket(master.data(), master.size(), ext.data(), ext.size(), pw, image.data(), where);
        if (rc == kWrongPassword) return kOk;  // opens nothing: a new password
        if (rc != kOk) return rc;
        a.ui().message(msgText(Msg::kPasswordAlreadyUsed), msgText(Msg::kCaptionVaultora), mb::kOk | mb::kIconWarning);
    }
}

}  // namespace

Result createWithPassword(Vaultora& a, const KeyBlockParams& params, const PasswordRecord& password) {
    ArchiveKey key;
    if (Result rc = CreateArchiveKey(params, key); rc != kOk) return rc;
    SecureBytes block;
    if (key.cipherId != 0) {
        if (Result rc = CreateMasterKeyBlock(params, password, key, block); rc != kOk) return rc;
    }
    a.setRecordCipher(key.cipherId, std::move(key.key), ClusterCipher(std::move(key.cipher)));
    return a.create(block.data(), block.size());
}

Result addPassword(Vaultora& a, const KeyBlockParams& params) {
    SecureBytes master, ext;
    bool encrypted = false;
    if (Result rc = readBlocksOfEncrypted(a, master, ext, encrypted); rc != kOk || !encrypted) return rc;
    PasswordRecord pw;
    if (Result rc = askNewPassword(a, master, ext, pw); rc != kOk) return rc;
    ArchiveKey key;
    if (Result rc = currentKey(a, key); rc != kOk) return rc;
    const std::array<uint8_t, 68> image = a.header().encode();
    bool alreadyUsed = false;
    SecureBytes newExt;
    Result rc = AddPasswordPacket(master.data(), master.size(), ext.data(), ext.size(), image.data(), key, params, pw,
                                  alreadyUsed, newExt);
    if (rc != kOk) return rc;
    if (!a.writeExtendedKeyBlock(newExt)) return kWriteFailed;
    return kOk;
}

Result changePassword(Vaultora& a, const KeyBlockParams& params) {
    SecureBytes master, ext;
    bool encrypted = false;
    if (Result rc = readBlocksOfEncrypted(a, master, ext, encrypted); rc != kOk || !encrypted) return rc;
    const std::array<uint8_t, 68> image = a.header().encode();
    PasswordPacketLocation where;
    for (;;) {
        PasswordRecord old;
        if (!a.ui().password(msgText(Msg::kEnterPasswordToRemove), old, false)) return kCancelled;
        Result rc = LocatePasswordPacket(master.data(), master.size(), ext.data(), ext.size(), old, image.data(), where);
        if (rc == kOk) break;
        if (rc != kWrongPassword) return rc;
        a.ui().message(msgText(Msg::kSessionKeyNotFound), msgText(Msg::kCaptionError), mb::kOk | mb::kIconError);
    }
    PasswordRecord pw;
    if (Result rc = askNewPassword(a, master, ext, pw); rc != kOk) return rc;
    ArchiveKey key;
    if (Result rc = currentKey(a, key); rc != kOk) return rc;
    if (where.block == KeyBlockKind::kExtended) {
        if (Result rc = ReplacePasswordPacket(ext.data(), ext.size(), where.packet, key, params, pw); rc != kOk) return rc;
        return a.writeExtendedKeyBlock(ext) ? kOk : kWriteFailed;
    }
    if (Result rc = ReplacePasswordPacket(master.data(), master.size(), where.packet, key, params, pw); rc != kOk)
        return rc;
    return a.writeMasterKeyBlock(master);
}

Result removePassword(Vaultora& a) {
    SecureBytes master, ext;
    if (Result rc = a.readMasterKeyBlock(master); rc != kOk) return rc;
    if (!a.readExtendedKeyBlock(ext) || CheckExtendedKeyBlock(ext.data(), ext.size()) != kOk) {
        int answer = a.ui().message(msgFormat(Msg::kExtendedKeyBlockCorruptedAdd, {a.path()}),
                                    msgText(Msg::kCaptionVaultora), mb::kYesNo | mb::kIconWarning);
        if (answer != kAnswerYes) return kKeyBlockCorrupt;
        return a.writeExtendedKeyBlock(SecureBytes()) ? kOk : kWriteFailed;
    }
    if (ext.empty()) {
        a.ui().message(msgText(Msg::kExtendedKeyBlockEmpty), msgText(Msg::kCaptionVaultora),
                       mb::kOk | mb::kIconInformation);
        return kOk;
    }
    const std::array<uint8_t, 68> image = a.header().encode();
    for (;;) {
        PasswordRecord pw;
        if (!a.ui().password(msgText(Msg::kEnterPasswordToRemove), pw, false)) return kCancelled;
        PacketLocation where;
        Result rc = FindPasswordPacket(ext.data(), ext.size(), pw, image.data(), where);
        if (rc == kOk) {
            if (Result r = RemoveKeyPacket(ext, where); r != kOk) return r;
            return a.writeExtendedKeyBlock(ext) ? kOk : kWriteFailed;
        }
        if (rc != kWrongPassword) return rc;
        if (FindPasswordPacket(master.data(), master.size(), pw, image.data(), where) == kOk) {
            a.ui().message(msgText(Msg::kPasswordOpensMasterKey), msgText(Msg::kCaptionVaultora),
                           mb::kOk | mb::kIconWarning);
        } else {
            a.ui().message(msgText(Msg::kSessionKeyNotFound), msgText(Msg::kCaptionError), mb::kOk | mb::kIconError);
        }
    }
}

}  // namespace vaultora
