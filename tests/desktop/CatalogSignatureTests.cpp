// Catalog signatures made with the real minisign tool, checked by our verifier.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "desktop/QZCatalogSignature.h"
#include "support/Minisign.h"

namespace {

namespace fs = std::filesystem;

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

/// `text` with the byte at `offset` of line `line` (0-based) replaced by `replacement`.
std::string ChangeLine(std::string text, int line, size_t offset, char replacement) {
    size_t start = 0;
    for (int i = 0; i < line; ++i)
        start = text.find('\n', start) + 1;
    text[start + offset] = text[start + offset] == replacement ? replacement + 1 : replacement;
    return text;
}

TEST(CatalogSignature, VerifiesWhatMinisignSignedAndNothingElse) {
    char pattern[] = "/tmp/gw-signature-XXXXXX";
    const std::string directory = mkdtemp(pattern);
    glyphwell::testing::MinisignKey key(directory, "a"), other(directory, "b");
    if (!key.IsValid())
        GTEST_SKIP() << "minisign is not installed";
    const auto publicKey = QZParseMinisignPublicKey(key.PublicKey());
    ASSERT_TRUE(publicKey);
    const std::string catalog = directory + "/catalog.json";
    std::ofstream(catalog) << R"({"assets": []})";
    const std::string data = Contents(catalog);
    const auto sign = [&](const glyphwell::testing::MinisignKey& with, const std::string& comment,
                          bool legacy) {
        EXPECT_TRUE(with.Sign(catalog, comment, legacy));
        return Contents(catalog + ".minisig");
    };
    const std::string prehashed = sign(key, "timestamp:1700000000\texpires:1800000000", false);
    std::string changedData = data;
    changedData[3] ^= 1;

    struct Case {
        const char* what;
        std::string data;
        std::string signature;
        std::string problem; // empty: valid
        int64_t version;
        std::optional<int64_t> expires;
    } cases[] = {
        {"ED", data, prehashed, "", 1700000000, 1800000000},
        {"Ed (legacy)", data, sign(key, "timestamp:42 file:catalog.json", true), "", 42, {}},
        {"a changed byte in the catalog", changedData, prehashed, "bad signature", 0, {}},
        {"a changed byte in the signature",
         data,
         ChangeLine(prehashed, 1, 40, 'A'),
         "bad signature",
         0,
         {}},
        {"a changed byte in the trusted comment",
         data,
         ChangeLine(prehashed, 2, 30, '9'),
         "bad signature of the trusted comment",
         0,
         {}},
        {"a changed global signature",
         data,
         ChangeLine(prehashed, 3, 10, 'A'),
         "bad signature of the trusted comment",
         0,
         {}},
        {"another key",
         data,
         sign(other, "timestamp:1", false),
         "signed with another key (",
         0,
         {}},
        {"no timestamp",
         data,
         sign(key, "file:catalog.json", false),
         "no timestamp in the trusted comment",
         0,
         {}},
        {"three lines",
         data,
         prehashed.substr(0, prehashed.rfind('\n', prehashed.size() - 2)),
         "not a minisign signature",
         0,
         {}},
        {"not base64", data, ChangeLine(prehashed, 1, 5, '*'), "not a minisign signature", 0, {}},
        {"over 4 KiB", data, prehashed + std::string(4096, '\n'), "signature larger than", 0, {}},
        {"empty", data, "", "not a minisign signature", 0, {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        const QZCatalogSignatureCheck check =
            QZVerifyCatalogSignature(c.data, c.signature, *publicKey);
        EXPECT_EQ(check.valid, c.problem.empty());
        EXPECT_EQ(check.problem.substr(0, c.problem.size()), c.problem) << check.problem;
        if (c.problem.empty()) {
            EXPECT_EQ(check.version, c.version);
            EXPECT_EQ(check.expires, c.expires);
        }
    }
    // minisign prints the key id that our reading of the key gives.
    EXPECT_NE(Contents(directory + "/a.pub").find(QZMinisignKeyIDText(publicKey->keyID)),
              std::string::npos);
    for (const char* bad : {"", "RWQ", "untrusted comment: x", "RUQQMk609u/0O+oI9Dm4OjdLoZId8GW0"})
        EXPECT_FALSE(QZParseMinisignPublicKey(bad)) << bad;
    fs::remove_all(directory);
}

} // namespace
