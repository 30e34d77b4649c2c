// Base64 through libsodium, whose decoder is strict: it takes no blanks, no cut text and no stray
// padding bits, so that a damaged command fails instead of running shortened.
#include "platform.h"
#include "tavisdk.h"

#include <sodium.h>

int SzBase64EncodeFull(const char *szText, size_t length, char *szBuf, size_t cbBuf, int urlSafe,
                       int pad) {
    const int alphabet = urlSafe ? sodium_base64_VARIANT_URLSAFE : sodium_base64_VARIANT_ORIGINAL;
    const int variant = alphabet | (pad ? 0 : sodium_base64_VARIANT_ORIGINAL_NO_PADDING);
    // sodium_bin2base64 ends the process when the buffer is too small.
    if (!szText || !szBuf || length > cbBuf || sodium_base64_encoded_len(length, variant) > cbBuf) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    sodium_bin2base64(szBuf, cbBuf, reinterpret_cast<const unsigned char *>(szText), length,
                      variant);
    return 0;
}

int TAVIEncodingBase64Decode(const char *szText, size_t length, char *pOut, size_t *pcbOut) {
    if (!szText || !pOut || !pcbOut) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    size_t produced = 0;
    if (sodium_base642bin(reinterpret_cast<unsigned char *>(pOut), *pcbOut, szText, length, nullptr,
                          &produced, nullptr, sodium_base64_VARIANT_ORIGINAL) != 0) {
        return PLATFORM_FAIL(platform::kBadFormat);
    }
    *pcbOut = produced;
    return 0;
}
