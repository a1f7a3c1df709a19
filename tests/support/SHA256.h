// SHA-256 computed in the tests with OpenSSL directly, rather than by the code under test.
#pragma once

#include <openssl/evp.h>

#include <cstdio>
#include <string>

namespace glyphwell::testing {

/// The SHA-256 of `bytes` as 64 lower-case hexadecimal digits.
inline std::string SHA256Of(const std::string& bytes) {
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    EVP_Digest(bytes.data(), bytes.size(), digest, &length, EVP_sha256(), nullptr);
    std::string hex;
    for (unsigned int i = 0; i < length; ++i) {
        char pair[3];
        std::snprintf(pair, sizeof pair, "%02x", digest[i]);
        hex += pair;
    }
    return hex;
}

} // namespace glyphwell::testing
