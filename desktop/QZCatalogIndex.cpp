// The compiled catalog index: the layout's constants, the compiler, the checking reader, and the
// loader that keeps one index file per source current. Every number read from an index file is
// checked before it is used; nothing in it is trusted.
#include "desktop/QZCatalogIndex.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <limits>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>
#include <unordered_map>
#include <vector>

#include "desktop/QZCatalogPaths.h"
#include "desktop/QZCatalogPublishers.h"
#include "desktop/QZSHA256.h"

namespace {

constexpr char kMagic[8] = {'G', 'W', 'C', 'A', 'T', 'I', 'X', '1'};
constexpr size_t kHeaderSize = 208;
constexpr size_t kAssetSize = 40;
constexpr size_t kFontSize = 32;
constexpr size_t kNameSize = 16;
constexpr size_t kLanguageSize = 8;
/// An index beyond this size is not mapped: no catalog of 64 MiB compiles into one.
constexpr uint64_t kMaximumIndexSize = 1ull << 30;

// Header field offsets.
enum : size_t {
    kFileSizeField = 16,
    kSourceSizeField = 24,
    kModifiedField = 32,
    kSHA256Field = 40,
    kPublicKeyField = 72,
    kSignatureField = 104,
    kPathField = 136,     ///< string reference: offset, length
    kCountsField = 144,   ///< assets, fonts, names, languages
    kSectionsField = 160, ///< assets, fonts, names, languages, strings offsets; strings size
};

template <typename T> T Load(const char* at) {
    T value;
    std::memcpy(&value, at, sizeof value);
    return value;
}
template <typename T> void Store(std::string& bytes, size_t at, T value) {
    std::memcpy(bytes.data() + at, &value, sizeof value);
}
template <typename T> void Append(std::string& bytes, T value) {
    bytes.append(reinterpret_cast<const char*>(&value), sizeof value);
}

/// The string section while compiling: each distinct string stored once.
class StringSection {
public:
    void Add(std::string& record, std::string_view text) {
        auto [entry, added] = offsets_.try_emplace(text, uint32_t(bytes_.size()));
        if (added)
            bytes_.append(text);
        Append(record, entry->second);
        Append(record, uint32_t(text.size()));
    }
    const std::string& Bytes() const { return bytes_; }

private:
    std::string bytes_;
    std::unordered_map<std::string_view, uint32_t> offsets_;
};

bool IsSHA256Text(std::string_view text) {
    return text.size() == 64 && std::all_of(text.begin(), text.end(), [](char c) {
               return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
           });
}

/// Whether `count` records of `size` bytes at `offset` lie inside `total` bytes after the header.
bool SectionFits(uint64_t offset, uint64_t count, size_t size, uint64_t total) {
    return offset >= kHeaderSize && offset <= total && count <= (total - offset) / size;
}

/// What the views of a catalog read from an index point into.
struct IndexStorage {
    std::shared_ptr<const void> owner;
    std::vector<QZDownloadableFont> fonts;
    std::vector<QZLocalizedName> names;
    std::vector<std::string_view> languages;
};

/// A read-only mapping of a file, unmapped with its last owner.
struct Mapping {
    void* address = MAP_FAILED;
    size_t size = 0;
    ~Mapping() {
        if (address != MAP_FAILED)
            munmap(address, size);
    }
};

std::array<unsigned char, 32> DigestBytes(std::string_view bytes) {
    std::array<unsigned char, 32> digest{};
    const std::string hex = QZSHA256Hex(bytes);
    for (size_t i = 0; i < digest.size() && hex.size() == 64; ++i)
        digest[i] = static_cast<unsigned char>(std::stoi(hex.substr(2 * i, 2), nullptr, 16));
    return digest;
}

/// The whole regular file at `path` if it has at most `limit` bytes.
std::optional<std::string> ReadWhole(const std::string& path, uint64_t limit) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    struct stat status {};
    if (fd < 0)
        return std::nullopt;
    std::string bytes;
    bool good =
        fstat(fd, &status) == 0 && S_ISREG(status.st_mode) && uint64_t(status.st_size) <= limit;
    if (good)
        bytes.resize(size_t(status.st_size));
    for (size_t done = 0; good && done < bytes.size();) {
        const ssize_t count = read(fd, bytes.data() + done, bytes.size() - done);
        if (count < 0 && errno == EINTR)
            continue;
        good = count > 0;
        done += good ? size_t(count) : 0;
    }
    close(fd);
    return good ? std::optional<std::string>(std::move(bytes)) : std::nullopt;
}

/// Maps and reads the index at `path`.
std::optional<QZDownloadableFontCatalog> MapIndex(const std::string& path, QZCatalogIndexKey* key) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
    if (fd < 0)
        return std::nullopt;
    struct stat status {};
    auto mapping = std::make_shared<Mapping>();
    if (fstat(fd, &status) == 0 && S_ISREG(status.st_mode) &&
        status.st_size >= off_t(kHeaderSize) && uint64_t(status.st_size) <= kMaximumIndexSize) {
        mapping->size = size_t(status.st_size);
        mapping->address = mmap(nullptr, mapping->size, PROT_READ, MAP_PRIVATE, fd, 0);
    }
    close(fd);
    if (mapping->address == MAP_FAILED)
        return std::nullopt;
    const std::string_view bytes(static_cast<const char*>(mapping->address), mapping->size);
    return QZReadCatalogIndex(bytes, mapping, key);
}

/// Writes `bytes` as the index at `path`: beside it first, then renamed over it.
void WriteIndex(const std::string& path, const std::string& bytes) {
    std::error_code ignored;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ignored);
    std::string temporary = path + ".XXXXXX";
    const int fd = mkstemp(temporary.data());
    if (fd < 0)
        return;
    bool good = true;
    for (size_t done = 0; good && done < bytes.size();) {
        const ssize_t written = write(fd, bytes.data() + done, bytes.size() - done);
        if (written < 0 && errno == EINTR)
            continue;
        good = written > 0;
        done += good ? size_t(written) : 0;
    }
    good = close(fd) == 0 && good;
    if (!good || rename(temporary.c_str(), path.c_str()) != 0)
        unlink(temporary.c_str());
}

} // namespace

std::string QZCompileCatalogIndex(const QZDownloadableFontCatalog& catalog,
                                  const QZCatalogIndexKey& key) {
    StringSection strings;
    std::string assets, fonts, names, languages, path;
    uint32_t fontCount = 0, nameCount = 0, languageCount = 0;
    strings.Add(path, key.path);
    for (const QZDownloadableFontAsset& asset : catalog.assets) {
        strings.Add(assets, asset.localID);
        strings.Add(assets, asset.url);
        strings.Add(assets, asset.sha256);
        Append(assets, uint64_t(asset.size));
        Append(assets, fontCount);
        Append(assets, uint32_t(asset.fonts.size()));
        for (const QZDownloadableFont& font : asset.fonts) {
            strings.Add(fonts, font.postScriptName);
            strings.Add(fonts, font.family);
            Append(fonts, nameCount);
            Append(fonts, uint32_t(font.localizedFamilyNames.size()));
            Append(fonts, languageCount);
            Append(fonts, uint32_t(font.languages.size()));
            for (const QZLocalizedName& name : font.localizedFamilyNames) {
                strings.Add(names, name.language);
                strings.Add(names, name.name);
            }
            for (const std::string_view language : font.languages)
                strings.Add(languages, language);
            nameCount += uint32_t(font.localizedFamilyNames.size());
            languageCount += uint32_t(font.languages.size());
            ++fontCount;
        }
    }
    std::string bytes(kHeaderSize, '\0');
    std::memcpy(bytes.data(), kMagic, sizeof kMagic);
    Store(bytes, 8, uint32_t(kHeaderSize));
    Store(bytes, kSourceSizeField, key.size);
    Store(bytes, kModifiedField, key.modified);
    std::memcpy(bytes.data() + kSHA256Field, key.sha256.data(), 32);
    std::memcpy(bytes.data() + kPublicKeyField, key.publicKey.data(), 32);
    std::memcpy(bytes.data() + kSignatureField, key.signatureSHA256.data(), 32);
    bytes.replace(kPathField, 8, path);
    const uint32_t counts[4] = {uint32_t(catalog.assets.size()), fontCount, nameCount,
                                languageCount};
    std::memcpy(bytes.data() + kCountsField, counts, sizeof counts);
    size_t section = kSectionsField;
    const std::string* parts[] = {&assets, &fonts, &names, &languages, &strings.Bytes()};
    for (const std::string* part : parts) {
        Store(bytes, section, uint64_t(bytes.size()));
        section += 8;
        bytes += *part;
    }
    Store(bytes, section, uint64_t(strings.Bytes().size()));
    Store(bytes, kFileSizeField, uint64_t(bytes.size()));
    return bytes;
}

std::optional<QZDownloadableFontCatalog> QZReadCatalogIndex(std::string_view bytes,
                                                            std::shared_ptr<const void> owner,
                                                            QZCatalogIndexKey* key) {
    const char* data = bytes.data();
    if (bytes.size() < kHeaderSize || std::memcmp(data, kMagic, sizeof kMagic) != 0 ||
        Load<uint32_t>(data + 8) != kHeaderSize ||
        Load<uint64_t>(data + kFileSizeField) != bytes.size())
        return std::nullopt;
    uint32_t counts[4];
    uint64_t offsets[5];
    std::memcpy(counts, data + kCountsField, sizeof counts);
    std::memcpy(offsets, data + kSectionsField, sizeof offsets);
    const uint64_t stringsSize = Load<uint64_t>(data + kSectionsField + 40);
    const size_t sizes[4] = {kAssetSize, kFontSize, kNameSize, kLanguageSize};
    for (int i = 0; i < 4; ++i)
        if (!SectionFits(offsets[i], counts[i], sizes[i], bytes.size()))
            return std::nullopt;
    if (!SectionFits(offsets[4], stringsSize, 1, bytes.size()))
        return std::nullopt;
    const char* stringBase = data + offsets[4];
    // A string reference read at `at`; false when it leaves the string section.
    const auto text = [&](const char* at, std::string_view* out) {
        const uint32_t offset = Load<uint32_t>(at), length = Load<uint32_t>(at + 4);
        if (offset > stringsSize || length > stringsSize - offset)
            return false;
        *out = std::string_view(stringBase + offset, length);
        return true;
    };
    std::string_view path;
    if (!text(data + kPathField, &path))
        return std::nullopt;
    key->path = std::string(path);
    key->size = Load<uint64_t>(data + kSourceSizeField);
    key->modified = Load<int64_t>(data + kModifiedField);
    std::memcpy(key->sha256.data(), data + kSHA256Field, 32);
    std::memcpy(key->publicKey.data(), data + kPublicKeyField, 32);
    std::memcpy(key->signatureSHA256.data(), data + kSignatureField, 32);

    auto storage = std::make_shared<IndexStorage>();
    storage->owner = std::move(owner);
    storage->names.resize(counts[2]);
    for (uint32_t i = 0; i < counts[2]; ++i) {
        const char* record = data + offsets[2] + i * kNameSize;
        if (!text(record, &storage->names[i].language) ||
            !text(record + 8, &storage->names[i].name))
            return std::nullopt;
    }
    storage->languages.resize(counts[3]);
    for (uint32_t i = 0; i < counts[3]; ++i)
        if (!text(data + offsets[3] + i * kLanguageSize, &storage->languages[i]))
            return std::nullopt;
    // A range of `count` records from `first` inside `total`.
    const auto range = [](uint32_t first, uint32_t count, uint32_t total) {
        return first <= total && count <= total - first;
    };
    storage->fonts.resize(counts[1]);
    for (uint32_t i = 0; i < counts[1]; ++i) {
        const char* record = data + offsets[1] + i * kFontSize;
        QZDownloadableFont& font = storage->fonts[i];
        const uint32_t firstName = Load<uint32_t>(record + 16),
                       nameCount = Load<uint32_t>(record + 20);
        const uint32_t firstLanguage = Load<uint32_t>(record + 24),
                       languageCount = Load<uint32_t>(record + 28);
        if (!text(record, &font.postScriptName) || font.postScriptName.empty() ||
            !text(record + 8, &font.family) || !range(firstName, nameCount, counts[2]) ||
            !range(firstLanguage, languageCount, counts[3]))
            return std::nullopt;
        font.localizedFamilyNames = {storage->names.data() + firstName, nameCount};
        font.languages = {storage->languages.data() + firstLanguage, languageCount};
        // LocalizedFamilyName looks names up by binary search: each language once, in order.
        for (uint32_t n = 1; n < nameCount; ++n)
            if (!(font.localizedFamilyNames[n - 1].language <
                  font.localizedFamilyNames[n].language))
                return std::nullopt;
    }
    QZDownloadableFontCatalog catalog;
    catalog.assets.resize(counts[0]);
    for (uint32_t i = 0; i < counts[0]; ++i) {
        const char* record = data + offsets[0] + i * kAssetSize;
        QZDownloadableFontAsset& asset = catalog.assets[i];
        asset.size = Load<uint64_t>(record + 24);
        const uint32_t firstFont = Load<uint32_t>(record + 32),
                       fontCount = Load<uint32_t>(record + 36);
        if (!text(record, &asset.localID) || asset.localID.empty() ||
            !text(record + 8, &asset.url) || asset.url.empty() ||
            !text(record + 16, &asset.sha256) || !IsSHA256Text(asset.sha256) ||
            asset.size > uint64_t(std::numeric_limits<int64_t>::max()) || fontCount == 0 ||
            !range(firstFont, fontCount, counts[1]))
            return std::nullopt;
        asset.fonts = {storage->fonts.data() + firstFont, fontCount};
    }
    catalog.storage = std::move(storage);
    return catalog;
}

std::string QZCatalogIndexPath(const std::string& path) {
    return QZGlyphwellCacheDirectory() + "/catalog-index/" + QZSHA256Hex(path).substr(0, 32) +
           ".index";
}

QZDownloadableFontCatalog QZLoadIndexedCatalogSource(const QZCatalogSource& source) {
    struct stat status {};
    if (stat(source.path.c_str(), &status) != 0)
        return QZLoadCatalogSource(source);
    QZCatalogIndexKey key;
    key.path = source.path;
    key.size = uint64_t(status.st_size);
    key.modified = int64_t(status.st_mtim.tv_sec) * 1000000000 + status.st_mtim.tv_nsec;
    if (source.kind == QZCatalogSource::Kind::Publisher) {
        key.publicKey = source.publicKey.key;
        if (const auto signature = ReadWhole(source.signaturePath, kMaximumCatalogSignatureSize))
            key.signatureSHA256 = DigestBytes(*signature);
    }
    const std::string indexPath = QZCatalogIndexPath(source.path);
    QZCatalogIndexKey stored;
    std::optional<QZDownloadableFontCatalog> indexed = MapIndex(indexPath, &stored);
    key.sha256 = stored.sha256;
    if (indexed && stored == key)
        return std::move(*indexed);
    // Changed, or only touched: the source's SHA-256 decides.
    const std::optional<std::string> bytes = ReadWhole(source.path, kMaximumPublishedCatalogSize);
    if (!bytes)
        return QZLoadCatalogSource(source); // logs why it cannot be read
    key.sha256 = DigestBytes(*bytes);
    key.size = bytes->size();
    if (indexed && stored.path == key.path && stored.sha256 == key.sha256 &&
        stored.publicKey == key.publicKey && stored.signatureSHA256 == key.signatureSHA256) {
        WriteIndex(indexPath, QZCompileCatalogIndex(*indexed, key));
        return std::move(*indexed);
    }
    QZDownloadableFontCatalog catalog = QZLoadCatalogSource(source);
    WriteIndex(indexPath, QZCompileCatalogIndex(catalog, key));
    return catalog;
}
