#include "desktop/QZSHA256.h"

#include <openssl/evp.h>

QZSHA256Digest::QZSHA256Digest() : context_(EVP_MD_CTX_new()) {
    if (context_ && EVP_DigestInit_ex(context_, EVP_sha256(), nullptr) != 1) {
        EVP_MD_CTX_free(context_);
        context_ = nullptr;
    }
}

QZSHA256Digest::~QZSHA256Digest() {
    EVP_MD_CTX_free(context_);
}

void QZSHA256Digest::Update(const void* bytes, size_t count) {
    if (context_ && EVP_DigestUpdate(context_, bytes, count) != 1) {
        EVP_MD_CTX_free(context_);
        context_ = nullptr;
    }
}

std::string QZSHA256Digest::FinishHex() {
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    if (!context_ || EVP_DigestFinal_ex(context_, digest, &length) != 1)
        return {};
    static const char kDigits[] = "0123456789abcdef";
    std::string text;
    text.reserve(length * 2);
    for (unsigned int i = 0; i < length; ++i) {
        text += kDigits[digest[i] >> 4];
        text += kDigits[digest[i] & 15];
    }
    return text;
}

std::string QZSHA256Hex(std::string_view bytes) {
    QZSHA256Digest digest;
    digest.Update(bytes.data(), bytes.size());
    return digest.FinishHex();
}
