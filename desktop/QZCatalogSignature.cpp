#include "desktop/QZCatalogSignature.h"

#include <charconv>
#include <memory>
#include <openssl/evp.h>
#include <vector>

namespace {

constexpr std::string_view kUntrustedPrefix = "untrusted comment: ";
constexpr std::string_view kTrustedPrefix = "trusted comment: ";
constexpr size_t kSignatureLineSize = 2 + 8 + 64;
constexpr size_t kGlobalSignatureSize = 64;

/// Canonical padded base64 without blanks; nothing otherwise.
std::optional<std::vector<unsigned char>> DecodeBase64(std::string_view text) {
    if (text.empty() || text.size() % 4 != 0 || text.size() > kMaximumCatalogSignatureSize)
        return std::nullopt;
    for (size_t i = 0; i < text.size(); ++i) {
        const char c = text[i];
        const bool padding =
            c == '=' && i + 2 >= text.size() && (i + 1 == text.size() || text[i + 1] == '=');
        if (!padding && !std::isalnum(static_cast<unsigned char>(c)) && c != '+' && c != '/')
            return std::nullopt;
    }
    std::vector<unsigned char> bytes(text.size() / 4 * 3);
    const int decoded = EVP_DecodeBlock(
        bytes.data(), reinterpret_cast<const unsigned char*>(text.data()), int(text.size()));
    if (decoded < 0)
        return std::nullopt;
    // EVP_DecodeBlock counts the padding as zero bytes.
    size_t padding = 0;
    while (padding < 2 && text[text.size() - 1 - padding] == '=')
        ++padding;
    bytes.resize(size_t(decoded) - padding);
    return bytes;
}

std::string_view Trim(std::string_view text) {
    const size_t first = text.find_first_not_of(" \t\r\n");
    if (first == std::string_view::npos)
        return {};
    return text.substr(first, text.find_last_not_of(" \t\r\n") - first + 1);
}

/// The next line of `text` from `*offset`, without its "\n" (or "\r\n").
std::optional<std::string_view> NextLine(std::string_view text, size_t* offset) {
    if (*offset >= text.size())
        return std::nullopt;
    size_t end = text.find('\n', *offset);
    if (end == std::string_view::npos)
        end = text.size();
    std::string_view line = text.substr(*offset, end - *offset);
    *offset = end + 1;
    if (!line.empty() && line.back() == '\r')
        line.remove_suffix(1);
    return line;
}

/// Whether `signature` is `key`'s Ed25519 signature of `message`.
bool VerifyEd25519(const QZMinisignPublicKey& key, const unsigned char* signature,
                   const unsigned char* message, size_t length) {
    std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> pkey(
        EVP_PKEY_new_raw_public_key(EVP_PKEY_ED25519, nullptr, key.key.data(), key.key.size()),
        EVP_PKEY_free);
    std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(),
                                                                    EVP_MD_CTX_free);
    // Ed25519 takes the whole message in one call and no separate digest.
    return pkey && context &&
           EVP_DigestVerifyInit(context.get(), nullptr, nullptr, nullptr, pkey.get()) == 1 &&
           EVP_DigestVerify(context.get(), signature, 64, message, length) == 1;
}

/// BLAKE2b-512 of `data`; empty when the digest interface failed.
std::vector<unsigned char> Blake2b512(std::string_view data) {
    std::vector<unsigned char> digest(EVP_MAX_MD_SIZE);
    unsigned int length = 0;
    if (EVP_Digest(data.data(), data.size(), digest.data(), &length, EVP_blake2b512(), nullptr) !=
            1 ||
        length != 64)
        return {};
    digest.resize(length);
    return digest;
}

/// The value of `name:N` among the blank-separated words of `comment`.
std::optional<int64_t> CommentNumber(std::string_view comment, std::string_view name) {
    size_t position = 0;
    while (position < comment.size()) {
        const size_t end = std::min(comment.find_first_of(" \t", position), comment.size());
        const std::string_view word = comment.substr(position, end - position);
        position = end + 1;
        if (word.size() <= name.size() + 1 || word.substr(0, name.size()) != name ||
            word[name.size()] != ':')
            continue;
        int64_t value = 0;
        const char* first = word.data() + name.size() + 1;
        const char* last = word.data() + word.size();
        const auto [stop, error] = std::from_chars(first, last, value);
        if (error == std::errc() && stop == last && value >= 0)
            return value;
        return std::nullopt;
    }
    return std::nullopt;
}

QZCatalogSignatureCheck Refused(std::string problem) {
    QZCatalogSignatureCheck check;
    check.problem = std::move(problem);
    return check;
}

} // namespace

std::optional<QZMinisignPublicKey> QZParseMinisignPublicKey(std::string_view text) {
    const std::optional<std::vector<unsigned char>> bytes = DecodeBase64(Trim(text));
    if (!bytes || bytes->size() != 2 + 8 + 32 || (*bytes)[0] != 'E' || (*bytes)[1] != 'd')
        return std::nullopt;
    QZMinisignPublicKey key;
    std::copy(bytes->begin() + 2, bytes->begin() + 10, key.keyID.begin());
    std::copy(bytes->begin() + 10, bytes->end(), key.key.begin());
    return key;
}

std::string QZMinisignKeyIDText(const std::array<unsigned char, 8>& keyID) {
    static const char digits[] = "0123456789ABCDEF";
    std::string text;
    // Stored little-endian: minisign prints the last byte first.
    for (size_t i = keyID.size(); i-- > 0;) {
        text += digits[keyID[i] >> 4];
        text += digits[keyID[i] & 15];
    }
    return text;
}

QZCatalogSignatureCheck QZVerifyCatalogSignature(std::string_view data,
                                                 std::string_view signatureFile,
                                                 const QZMinisignPublicKey& key) {
    if (signatureFile.size() > kMaximumCatalogSignatureSize)
        return Refused("signature larger than " + std::to_string(kMaximumCatalogSignatureSize) +
                       " bytes");
    size_t offset = 0;
    const auto untrusted = NextLine(signatureFile, &offset);
    const auto signatureLine = NextLine(signatureFile, &offset);
    const auto trusted = NextLine(signatureFile, &offset);
    const auto globalLine = NextLine(signatureFile, &offset);
    if (!globalLine || untrusted->substr(0, kUntrustedPrefix.size()) != kUntrustedPrefix ||
        trusted->substr(0, kTrustedPrefix.size()) != kTrustedPrefix ||
        !Trim(signatureFile.substr(std::min(offset, signatureFile.size()))).empty())
        return Refused("not a minisign signature");
    const auto signature = DecodeBase64(*signatureLine);
    const auto global = DecodeBase64(*globalLine);
    if (!signature || signature->size() != kSignatureLineSize || !global ||
        global->size() != kGlobalSignatureSize)
        return Refused("not a minisign signature");
    const bool prehashed = (*signature)[0] == 'E' && (*signature)[1] == 'D';
    if (!prehashed && !((*signature)[0] == 'E' && (*signature)[1] == 'd'))
        return Refused("unknown signature algorithm");
    if (!std::equal(key.keyID.begin(), key.keyID.end(), signature->begin() + 2))
        return Refused("signed with another key (" +
                       QZMinisignKeyIDText({(*signature)[2], (*signature)[3], (*signature)[4],
                                            (*signature)[5], (*signature)[6], (*signature)[7],
                                            (*signature)[8], (*signature)[9]}) +
                       ", expected " + QZMinisignKeyIDText(key.keyID) + ")");
    const unsigned char* ed25519 = signature->data() + 10;
    bool verified = false;
    if (prehashed) {
        const std::vector<unsigned char> digest = Blake2b512(data);
        verified = !digest.empty() && VerifyEd25519(key, ed25519, digest.data(), digest.size());
    } else {
        verified = VerifyEd25519(key, ed25519, reinterpret_cast<const unsigned char*>(data.data()),
                                 data.size());
    }
    if (!verified)
        return Refused("bad signature");
    const std::string_view comment = trusted->substr(kTrustedPrefix.size());
    std::vector<unsigned char> signedComment(ed25519, ed25519 + 64);
    signedComment.insert(signedComment.end(), comment.begin(), comment.end());
    if (!VerifyEd25519(key, global->data(), signedComment.data(), signedComment.size()))
        return Refused("bad signature of the trusted comment");
    const std::optional<int64_t> version = CommentNumber(comment, "timestamp");
    if (!version)
        return Refused("no timestamp in the trusted comment");
    QZCatalogSignatureCheck check;
    check.valid = true;
    check.trustedComment = std::string(comment);
    check.version = *version;
    check.expires = CommentNumber(comment, "expires");
    return check;
}
