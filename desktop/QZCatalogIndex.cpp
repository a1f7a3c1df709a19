// The compiled catalog index: the layout's constants, the compiler, the checking reader, and the
// loader that keeps one index file per source current. Every number read from an index file is
// checked before it is used; nothing in it is trusted.
#include "desktop/QZCatalogIndex.h"

#include <algorithm>
#include <chrono>
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
#include "platform/ReplaceFile.h"

namespace {

constexpr char kMagic[8] = {'G', 'W', 'C', 'A', 'T', 'I', 'X', '2'};
constexpr size_t kHeaderSize = 224;
constexpr size_t kAssetSize = 40;
constexpr size_t kFontSize = 32;
constexpr size_t kNameSize = 16;
constexpr size_t kLanguageSize = 8;
constexpr size_t kLookupSize = 16; ///< hash of a PostScript name, asset, font
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
    kCountsField = 144,   ///< assets, fonts, names, languages, lookup entries
    kSectionsField = 168, ///< the same sections' offsets, the strings' offset, the strings' size
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

/// FNV-1a: the lookup table's hash of a PostScript name.
uint64_t NameHash(std::string_view name) {
    uint64_t hash = 14695981039346656037ull;
    for (const char c : name)
        hash = (hash ^ static_cast<unsigned char>(c)) * 1099511628211ull;
    return hash;
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

/// Maps and checks the index at `path`.
std::shared_ptr<const QZCatalogIndexView> MapIndex(const std::string& path,
                                                   QZCatalogIndexKey* key) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
    if (fd < 0)
        return nullptr;
    struct stat status {};
    auto mapping = std::make_shared<Mapping>();
    if (fstat(fd, &status) == 0 && S_ISREG(status.st_mode) &&
        status.st_size >= off_t(kHeaderSize) && uint64_t(status.st_size) <= kMaximumIndexSize) {
        mapping->size = size_t(status.st_size);
        mapping->address = mmap(nullptr, mapping->size, PROT_READ, MAP_PRIVATE, fd, 0);
    }
    close(fd);
    if (mapping->address == MAP_FAILED)
        return nullptr;
    const std::string_view bytes(static_cast<const char*>(mapping->address), mapping->size);
    return QZCatalogIndexView::Open(bytes, mapping, key, path);
}

/// Removes the other indexes of the folder of `path` whose source is gone (or that cannot be
/// read as an index), and temporaries that a writer left a day ago: an index is compiled rarely,
/// and the folder holds one file per catalog ever read.
void RemoveOrphanIndexes(const std::string& path) {
    namespace fs = std::filesystem;
    std::error_code error;
    const auto now = fs::file_time_type::clock::now();
    for (fs::directory_iterator it(fs::path(path).parent_path(), error), end; !error && it != end;
         it.increment(error)) {
        const fs::path entry = it->path();
        const std::string name = entry.filename().string();
        std::error_code ignored;
        if (entry == path || !it->is_regular_file(ignored))
            continue;
        if (name.starts_with('.')) {
            if (now - it->last_write_time(ignored) > std::chrono::hours(24))
                fs::remove(entry, ignored);
            continue;
        }
        QZCatalogIndexKey key;
        if (!name.ends_with(".index"))
            continue;
        if (!MapIndex(entry, &key) || key.path.empty() || !fs::exists(key.path, ignored))
            fs::remove(entry, ignored);
    }
}

/// Writes `bytes` as the index at `path` (private to the user, like the cache it lives in).
void WriteIndex(const std::string& path, const std::string& bytes) {
    std::error_code ignored;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ignored);
    glyphwell::ReplaceFile(path, bytes, 0600);
    RemoveOrphanIndexes(path);
}

} // namespace

std::string QZCompileCatalogIndex(const QZDownloadableFontCatalog& catalog,
                                  const QZCatalogIndexKey& key) {
    StringSection strings;
    std::string assets, fonts, names, languages, path;
    uint32_t fontCount = 0, nameCount = 0, languageCount = 0;
    std::vector<std::array<uint64_t, 3>> lookups; // hash, asset, font
    strings.Add(path, key.path);
    for (const QZDownloadableFontAsset& asset : catalog.assets) {
        strings.Add(assets, asset.localID);
        strings.Add(assets, asset.url);
        strings.Add(assets, asset.sha256);
        Append(assets, uint64_t(asset.size));
        Append(assets, fontCount);
        Append(assets, uint32_t(asset.fonts.size()));
        for (const QZDownloadableFont& font : asset.fonts) {
            lookups.push_back({NameHash(font.postScriptName),
                               uint64_t(&asset - catalog.assets.data()), fontCount});
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
    std::sort(lookups.begin(), lookups.end());
    std::string table;
    for (const auto& [hash, asset, font] : lookups) {
        Append(table, hash);
        Append(table, uint32_t(asset));
        Append(table, uint32_t(font));
    }
    const uint32_t counts[5] = {uint32_t(catalog.assets.size()), fontCount, nameCount,
                                languageCount, uint32_t(lookups.size())};
    std::memcpy(bytes.data() + kCountsField, counts, sizeof counts);
    size_t section = kSectionsField;
    const std::string* parts[] = {&assets, &fonts, &names, &languages, &table, &strings.Bytes()};
    for (const std::string* part : parts) {
        Store(bytes, section, uint64_t(bytes.size()));
        section += 8;
        bytes += *part;
    }
    Store(bytes, section, uint64_t(strings.Bytes().size()));
    Store(bytes, kFileSizeField, uint64_t(bytes.size()));
    return bytes;
}

std::string_view QZCatalogIndexView::String(const char* reference) const {
    return std::string_view(data_ + offsets_[5] + Load<uint32_t>(reference),
                            Load<uint32_t>(reference + 4));
}

std::shared_ptr<const QZCatalogIndexView>
QZCatalogIndexView::Open(std::string_view bytes, std::shared_ptr<const void> owner,
                         QZCatalogIndexKey* key, std::string path) {
    const char* data = bytes.data();
    if (bytes.size() < kHeaderSize || std::memcmp(data, kMagic, sizeof kMagic) != 0 ||
        Load<uint32_t>(data + 8) != kHeaderSize ||
        Load<uint64_t>(data + kFileSizeField) != bytes.size())
        return nullptr;
    std::shared_ptr<QZCatalogIndexView> view(new QZCatalogIndexView);
    uint32_t* counts = view->counts_;
    uint64_t* offsets = view->offsets_;
    std::memcpy(counts, data + kCountsField, sizeof view->counts_);
    std::memcpy(offsets, data + kSectionsField, sizeof view->offsets_);
    const uint64_t stringsSize = Load<uint64_t>(data + kSectionsField + sizeof view->offsets_);
    const size_t sizes[5] = {kAssetSize, kFontSize, kNameSize, kLanguageSize, kLookupSize};
    for (int i = 0; i < 5; ++i)
        if (!SectionFits(offsets[i], counts[i], sizes[i], bytes.size()))
            return nullptr;
    if (!SectionFits(offsets[5], stringsSize, 1, bytes.size()))
        return nullptr;
    view->data_ = data;
    // Whether the string reference at `at` lies inside the string section.
    const auto valid = [&](const char* at) {
        const uint32_t offset = Load<uint32_t>(at), length = Load<uint32_t>(at + 4);
        return offset <= stringsSize && length <= stringsSize - offset;
    };
    // A range of `count` records from `first` inside `total`.
    const auto range = [](uint32_t first, uint32_t count, uint32_t total) {
        return first <= total && count <= total - first;
    };
    if (!valid(data + kPathField))
        return nullptr;
    key->path = std::string(view->String(data + kPathField));
    key->size = Load<uint64_t>(data + kSourceSizeField);
    key->modified = Load<int64_t>(data + kModifiedField);
    std::memcpy(key->sha256.data(), data + kSHA256Field, 32);
    std::memcpy(key->publicKey.data(), data + kPublicKeyField, 32);
    std::memcpy(key->signatureSHA256.data(), data + kSignatureField, 32);

    for (uint32_t i = 0; i < counts[2]; ++i) {
        const char* record = data + offsets[2] + i * kNameSize;
        if (!valid(record) || !valid(record + 8))
            return nullptr;
    }
    for (uint32_t i = 0; i < counts[3]; ++i)
        if (!valid(data + offsets[3] + i * kLanguageSize))
            return nullptr;
    for (uint32_t i = 0; i < counts[1]; ++i) {
        const char* record = data + offsets[1] + i * kFontSize;
        const uint32_t firstName = Load<uint32_t>(record + 16),
                       nameCount = Load<uint32_t>(record + 20);
        if (!valid(record) || !valid(record + 8) || !range(firstName, nameCount, counts[2]) ||
            !range(Load<uint32_t>(record + 24), Load<uint32_t>(record + 28), counts[3]))
            return nullptr;
    }
    for (uint32_t i = 0; i < counts[0]; ++i) {
        const char* record = data + offsets[0] + i * kAssetSize;
        const uint32_t fontCount = Load<uint32_t>(record + 36);
        if (!valid(record) || !valid(record + 8) || !valid(record + 16) || fontCount == 0 ||
            !range(Load<uint32_t>(record + 32), fontCount, counts[1]))
            return nullptr;
    }
    // The lookup table: sorted, each entry a font of its asset.
    for (uint32_t i = 0; i < counts[4]; ++i) {
        const char* entry = data + offsets[4] + i * kLookupSize;
        const uint32_t asset = Load<uint32_t>(entry + 8), font = Load<uint32_t>(entry + 12);
        if (asset >= counts[0])
            return nullptr;
        const char* record = data + offsets[0] + size_t(asset) * kAssetSize;
        const uint32_t first = Load<uint32_t>(record + 32);
        if (font < first || font - first >= Load<uint32_t>(record + 36) ||
            (i > 0 && std::make_pair(Load<uint64_t>(entry - kLookupSize),
                                     Load<uint32_t>(entry - kLookupSize + 8)) >
                          std::make_pair(Load<uint64_t>(entry), asset)))
            return nullptr;
    }
    view->owner_ = std::move(owner);
    view->path_ = std::move(path);
    return view;
}

bool QZCatalogIndexView::AssetIsSound(const char* record) const {
    const auto fontRecord = [&](uint32_t font) {
        return data_ + offsets_[1] + size_t(font) * kFontSize;
    };
    if (String(record).empty() || String(record + 8).empty() ||
        !IsSHA256Text(String(record + 16)) ||
        Load<uint64_t>(record + 24) > uint64_t(std::numeric_limits<int64_t>::max()))
        return false;
    const uint32_t first = Load<uint32_t>(record + 32), fontCount = Load<uint32_t>(record + 36);
    for (uint32_t f = first; f < first + fontCount; ++f) {
        const char* font = fontRecord(f);
        if (String(font).empty())
            return false;
        // LocalizedFamilyName looks names up by binary search: each language once, in order.
        const char* names = data_ + offsets_[2] + size_t(Load<uint32_t>(font + 16)) * kNameSize;
        for (uint32_t n = 1; n < Load<uint32_t>(font + 20); ++n)
            if (!(String(names + (n - 1) * kNameSize) < String(names + n * kNameSize)))
                return false;
    }
    return true;
}

std::vector<uint32_t> QZCatalogIndexView::AssetsOffering(std::string_view postScriptName) const {
    const uint64_t hash = NameHash(postScriptName);
    uint32_t low = 0, high = counts_[4];
    const char* table = data_ + offsets_[4];
    while (low < high) {
        const uint32_t middle = low + (high - low) / 2;
        if (Load<uint64_t>(table + size_t(middle) * kLookupSize) < hash)
            low = middle + 1;
        else
            high = middle;
    }
    std::vector<uint32_t> assets;
    for (; low < counts_[4] && Load<uint64_t>(table + size_t(low) * kLookupSize) == hash; ++low) {
        const char* entry = table + size_t(low) * kLookupSize;
        const uint32_t asset = Load<uint32_t>(entry + 8), font = Load<uint32_t>(entry + 12);
        if (String(data_ + offsets_[1] + size_t(font) * kFontSize) == postScriptName &&
            (assets.empty() || assets.back() != asset))
            assets.push_back(asset);
    }
    return assets;
}

QZDownloadableFontCatalog QZCatalogIndexView::Catalog(const std::vector<uint32_t>& wanted,
                                                      bool all) const {
    // Each asset's contents are checked before a view of it is made; a damaged one is left out
    // and the index file removed, so that the next question compiles it again.
    std::vector<uint32_t> indexes;
    for (size_t i = 0, end = all ? counts_[0] : wanted.size(); i < end; ++i) {
        const uint32_t index = all ? uint32_t(i) : wanted[i];
        if (AssetIsSound(data_ + offsets_[0] + size_t(index) * kAssetSize))
            indexes.push_back(index);
        else if (!damaged_.exchange(true) && !path_.empty())
            unlink(path_.c_str());
    }
    const size_t count = indexes.size();
    const auto assetRecord = [&](size_t i) {
        return data_ + offsets_[0] + size_t(indexes[i]) * kAssetSize;
    };
    const auto fontRecord = [&](uint32_t font) {
        return data_ + offsets_[1] + size_t(font) * kFontSize;
    };
    // The sizes first, so that the vectors never move once views into them are made.
    auto storage = std::make_shared<IndexStorage>();
    size_t fonts = 0, names = 0, languages = 0;
    for (size_t i = 0; i < count; ++i) {
        const uint32_t first = Load<uint32_t>(assetRecord(i) + 32);
        const uint32_t fontCount = Load<uint32_t>(assetRecord(i) + 36);
        fonts += fontCount;
        for (uint32_t f = first; f < first + fontCount; ++f) {
            names += Load<uint32_t>(fontRecord(f) + 20);
            languages += Load<uint32_t>(fontRecord(f) + 28);
        }
    }
    storage->owner = owner_;
    storage->fonts.reserve(fonts);
    storage->names.reserve(names);
    storage->languages.reserve(languages);
    QZDownloadableFontCatalog catalog;
    catalog.assets.resize(count);
    for (size_t i = 0; i < count; ++i) {
        const char* record = assetRecord(i);
        QZDownloadableFontAsset& asset = catalog.assets[i];
        asset.localID = String(record);
        asset.url = String(record + 8);
        asset.sha256 = String(record + 16);
        asset.size = Load<uint64_t>(record + 24);
        const uint32_t first = Load<uint32_t>(record + 32), fontCount = Load<uint32_t>(record + 36);
        const size_t fontStart = storage->fonts.size();
        for (uint32_t f = first; f < first + fontCount; ++f) {
            const char* font = fontRecord(f);
            QZDownloadableFont& made = storage->fonts.emplace_back();
            made.postScriptName = String(font);
            made.family = String(font + 8);
            const size_t nameStart = storage->names.size();
            const uint32_t firstName = Load<uint32_t>(font + 16);
            for (uint32_t n = 0; n < Load<uint32_t>(font + 20); ++n) {
                const char* name = data_ + offsets_[2] + size_t(firstName + n) * kNameSize;
                storage->names.push_back({String(name), String(name + 8)});
            }
            made.localizedFamilyNames = {storage->names.data() + nameStart,
                                         storage->names.size() - nameStart};
            const size_t languageStart = storage->languages.size();
            const uint32_t firstLanguage = Load<uint32_t>(font + 24);
            for (uint32_t l = 0; l < Load<uint32_t>(font + 28); ++l)
                storage->languages.push_back(
                    String(data_ + offsets_[3] + size_t(firstLanguage + l) * kLanguageSize));
            made.languages = {storage->languages.data() + languageStart,
                              storage->languages.size() - languageStart};
        }
        asset.fonts = {storage->fonts.data() + fontStart, fontCount};
    }
    catalog.storage = std::move(storage);
    return catalog;
}

std::optional<QZDownloadableFontCatalog> QZReadCatalogIndex(std::string_view bytes,
                                                            std::shared_ptr<const void> owner,
                                                            QZCatalogIndexKey* key) {
    const auto view = QZCatalogIndexView::Open(bytes, std::move(owner), key);
    if (!view)
        return std::nullopt;
    QZDownloadableFontCatalog catalog = view->Catalog({}, true);
    if (view->IsDamaged())
        return std::nullopt;
    return catalog;
}

std::string QZCatalogIndexPath(const std::string& path) {
    return QZGlyphwellCacheDirectory() + "/catalog-index/" + QZSHA256Hex(path).substr(0, 32) +
           ".index";
}

std::shared_ptr<const QZCatalogIndexView>
QZLoadIndexedCatalogSource(const QZCatalogSource& source) {
    // The index of `catalog` as written to `indexPath`, or held in memory when it cannot be.
    const auto compile = [](const QZDownloadableFontCatalog& catalog, const QZCatalogIndexKey& key,
                            const std::string& indexPath) {
        auto bytes = std::make_shared<const std::string>(QZCompileCatalogIndex(catalog, key));
        WriteIndex(indexPath, *bytes);
        // Mapped from the file when it was written: pages the kernel can share and drop.
        QZCatalogIndexKey written;
        if (auto mapped = MapIndex(indexPath, &written); mapped && written == key)
            return mapped;
        return QZCatalogIndexView::Open(*bytes, bytes, &written);
    };
    const std::string indexPath = QZCatalogIndexPath(source.path);
    struct stat status {};
    if (stat(source.path.c_str(), &status) != 0)
        return compile(QZLoadCatalogSource(source), {}, indexPath);
    QZCatalogIndexKey key;
    key.path = source.path;
    key.size = uint64_t(status.st_size);
    key.modified = int64_t(status.st_mtim.tv_sec) * 1000000000 + status.st_mtim.tv_nsec;
    if (source.kind == QZCatalogSource::Kind::Publisher) {
        key.publicKey = source.publicKey.key;
        if (const auto signature =
                QZReadCatalogFile(source.signaturePath, kMaximumCatalogSignatureSize))
            key.signatureSHA256 = DigestBytes(*signature);
    }
    QZCatalogIndexKey stored;
    const std::shared_ptr<const QZCatalogIndexView> indexed = MapIndex(indexPath, &stored);
    key.sha256 = stored.sha256;
    if (indexed && stored == key)
        return indexed;
    // Changed, or only touched: the source's SHA-256 decides.
    const std::optional<std::string> bytes =
        QZReadCatalogFile(source.path, kMaximumPublishedCatalogSize);
    if (!bytes)
        return compile(QZLoadCatalogSource(source), {}, indexPath); // logs why it is unreadable
    key.sha256 = DigestBytes(*bytes);
    key.size = bytes->size();
    if (indexed && stored.path == key.path && stored.sha256 == key.sha256 &&
        stored.publicKey == key.publicKey && stored.signatureSHA256 == key.signatureSHA256)
        return compile(indexed->Catalog({}, true), key, indexPath);
    return compile(QZCatalogFromSourceBytes(source, *bytes), key, indexPath);
}
