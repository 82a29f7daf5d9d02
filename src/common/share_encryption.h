// Whether a share keeps its names encrypted on disk, where names have less room. Shared by the
// error translations (which must not touch the error slot or log) and NvoLibCheckEncryptShare.
#pragma once
#include "common/owners.h"
#include "common/path_names.h"
#include "quib_share.h"

namespace norvo {

enum class Encryption { kPlain, kEncrypted, kNoShare };

// share is a share name or path as the platform looks it up; a home is never encrypted.
inline Encryption ShareEncryption(const char *share) {
    if (IsOwnHomeName(share)) {
        return Encryption::kPlain;
    }
    ShareRecord record = GetShare(share);
    if (!record) {
        return Encryption::kNoShare;
    }
    return (record->fStatus & SHARE_STATUS_ENCRYPTED) != 0 ? Encryption::kEncrypted : Encryption::kPlain;
}

}  // namespace norvo
