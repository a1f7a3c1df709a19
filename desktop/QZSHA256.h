// SHA-256 through OpenSSL's digest interface, as lower-case hexadecimal text: the digest that the
// downloadable-font catalog gives for each asset. Shared by the downloader and the catalog tool.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

struct evp_md_ctx_st;

/// An incremental SHA-256 computation. A failure of the digest interface (allocation, an
/// unusable provider) makes it invalid for good; its result is then empty.
class QZSHA256Digest {
public:
    QZSHA256Digest();
    ~QZSHA256Digest();
    QZSHA256Digest(const QZSHA256Digest&) = delete;
    QZSHA256Digest& operator=(const QZSHA256Digest&) = delete;

    /// False once the digest interface has failed.
    bool IsValid() const { return context_ != nullptr; }
    /// Adds `count` bytes at `bytes`.
    void Update(const void* bytes, size_t count);
    /// The digest as 64 lower-case hexadecimal digits; empty when the computation failed.
    /// Call once.
    std::string FinishHex();

private:
    evp_md_ctx_st* context_;
};

/// The SHA-256 of `bytes` as 64 lower-case hexadecimal digits; empty when the digest failed.
std::string QZSHA256Hex(std::string_view bytes);
