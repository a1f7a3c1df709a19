// Signatures of downloadable-font catalogs in minisign's format, so that a publisher signs with
// the `minisign` tool and nothing else.
//
// A public key is the base64 of "Ed", an 8-byte key id and a 32-byte Ed25519 key. A signature file
// has four lines: an untrusted comment, the base64 of a 2-byte algorithm ("ED": the Ed25519
// signature covers the BLAKE2b-512 of the data; "Ed": it covers the data itself), the key id and
// the 64-byte signature; "trusted comment: " and its text; and the base64 of a second signature,
// over the first signature followed by the trusted comment's text. The trusted comment's
// `timestamp:N` is the catalog's version and an optional `expires:N` (Unix time) ends its
// validity. Verification uses OpenSSL's EVP interface; no other library. No Qt.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

/// The largest signature file read: minisign's are under 500 bytes.
inline constexpr size_t kMaximumCatalogSignatureSize = 4096;

/// A publisher's key, as a `minisign.pub` holds it.
struct QZMinisignPublicKey {
    std::array<unsigned char, 8> keyID{};
    std::array<unsigned char, 32> key{};
};

/// The key in `text`: the base64 line of a `minisign.pub` (surrounding blanks ignored). Nothing
/// when it is not one.
std::optional<QZMinisignPublicKey> QZParseMinisignPublicKey(std::string_view text);

/// The key id as minisign prints it: 16 upper-case hexadecimal digits, most significant first.
std::string QZMinisignKeyIDText(const std::array<unsigned char, 8>& keyID);

/// What a signature says about the data it covers.
struct QZCatalogSignatureCheck {
    bool valid = false;
    std::string problem;            ///< why it is not valid, a short phrase for logs and the CLI
    std::string trustedComment;     ///< the signed comment's text, when valid
    int64_t version = 0;            ///< the trusted comment's `timestamp:N`
    std::optional<int64_t> expires; ///< its `expires:N`, when given
};

/// Verifies `signatureFile` (a `.minisig` file's bytes) over `data` with `key`. Valid only when
/// the file has the four lines, the key id is `key`'s, both signatures verify and the trusted
/// comment gives a `timestamp:N`; otherwise the problem says which check failed.
QZCatalogSignatureCheck QZVerifyCatalogSignature(std::string_view data,
                                                 std::string_view signatureFile,
                                                 const QZMinisignPublicKey& key);
