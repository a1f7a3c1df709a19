// Reading the downloadable font catalog in one streaming pass: JSON events (nlohmann::json's SAX
// interface) go straight into the compact form of QZDownloadableFontCatalog, and no document is
// ever built. An asset is checked as a whole when its object ends, with the same rules and in the
// same order as its members are documented, and rolled back when it is malformed.
#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <limits>
#include <nlohmann/json.hpp>
#include <sys/stat.h>
#include <unordered_set>

#include "desktop/QZDownloadableFontCatalog.h"

namespace {

/// A catalog beyond this size is not read: it cannot be a list of font files.
constexpr size_t kMaximumCatalogSize = 64 << 20;
constexpr size_t kArenaBlockSize = 64 << 10;
constexpr size_t kReadChunkSize = 64 << 10;
/// How many of the latest strings a new one is compared with: families and localized names
/// repeat between the fonts of one asset, language identifiers everywhere.
constexpr size_t kRecentStrings = 8;

/// Strings stored back to back in large blocks that never move, so views into them stay valid.
class StringArena {
public:
    struct Mark {
        size_t blocks = 0;
        size_t used = 0;
    };

    std::string_view Store(std::string_view text) {
        for (const std::string_view recent : recent_)
            if (recent == text)
                return recent;
        if (text.empty())
            return {};
        // A string longer than a block gets a block of its own, full from the start.
        const size_t room = used_ < kArenaBlockSize ? kArenaBlockSize - used_ : 0;
        if (blocks_.empty() || room < text.size()) {
            blocks_.push_back(std::make_unique<char[]>(std::max(kArenaBlockSize, text.size())));
            used_ = 0;
        }
        char* place = blocks_.back().get() + used_;
        std::memcpy(place, text.data(), text.size());
        used_ += text.size();
        const std::string_view stored(place, text.size());
        recent_[next_++ % kRecentStrings] = stored;
        return stored;
    }
    Mark GetMark() const { return {blocks_.size(), used_}; }
    /// Forgets every string stored since `mark`.
    void Rewind(Mark mark) {
        blocks_.resize(mark.blocks);
        used_ = mark.used;
        recent_.fill({});
    }

private:
    std::vector<std::unique_ptr<char[]>> blocks_;
    size_t used_ = 0; ///< bytes used in the last block
    std::array<std::string_view, kRecentStrings> recent_{};
    size_t next_ = 0;
};

/// What the catalog's views point into.
struct CatalogStorage {
    StringArena strings;
    std::vector<QZDownloadableFont> fonts;
    std::vector<QZLocalizedName> names;
};

/// Bytes from memory or a file, one at a time, with the place of the next one.
class ByteSource {
public:
    explicit ByteSource(std::string_view bytes) : data_(bytes.data()), end_(bytes.size()) {}
    explicit ByteSource(FILE* file) : file_(file), buffer_(kReadChunkSize) {}

    /// Whether no byte is left (a file beyond the size limit ends there, marked too large).
    bool AtEnd() {
        if (position_ < end_)
            return false;
        if (!file_ || tooLarge_)
            return true;
        offset_ += end_;
        position_ = 0;
        end_ = fread(buffer_.data(), 1, buffer_.size(), file_);
        data_ = buffer_.data();
        if (offset_ + end_ > kMaximumCatalogSize) {
            tooLarge_ = true;
            end_ = 0;
        }
        return end_ == 0;
    }
    const char& Current() const { return data_[position_]; }
    void Advance() {
        if (data_[position_++] == '\n') {
            ++line_;
            column_ = 1;
        } else {
            ++column_;
        }
    }
    size_t Line() const { return line_; }
    size_t Column() const { return column_; }
    bool TooLarge() const { return tooLarge_; }
    bool ReadFailed() const { return file_ && ferror(file_); }

private:
    FILE* file_ = nullptr;
    std::vector<char> buffer_;
    const char* data_ = nullptr;
    size_t position_ = 0;
    size_t end_ = 0;
    size_t offset_ = 0; ///< file offset of the buffer's first byte
    size_t line_ = 1;
    size_t column_ = 1;
    bool tooLarge_ = false;
};

/// An input iterator over a ByteSource, as the JSON parser takes its input.
class ByteIterator {
public:
    using iterator_category = std::input_iterator_tag;
    using value_type = char;
    using difference_type = std::ptrdiff_t;
    using pointer = const char*;
    using reference = const char&;

    ByteIterator() = default;
    explicit ByteIterator(ByteSource* source) : source_(source) {}
    reference operator*() const { return source_->Current(); }
    ByteIterator& operator++() {
        source_->Advance();
        return *this;
    }
    bool operator==(const ByteIterator& other) const { return AtEnd() == other.AtEnd(); }

private:
    bool AtEnd() const { return !source_ || source_->AtEnd(); }
    ByteSource* source_ = nullptr;
};

bool IsSHA256(std::string_view text) {
    return text.size() == 64 && std::all_of(text.begin(), text.end(), [](char c) {
               return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f');
           });
}

/// What a member's value turned out to be, for the checks at the end of its object.
enum class Seen { Absent, Valid, Invalid };

/// One font while it is read: indexes into the storage, made views once the catalog is complete.
struct FontRecord {
    Seen postScriptName = Seen::Absent;
    Seen family = Seen::Absent;
    Seen names = Seen::Absent;
    std::string_view postScriptNameText;
    std::string_view familyText;
    size_t namesBegin = 0;
    size_t namesCount = 0;       ///< once the font ended
    std::vector<bool> nameValid; ///< per name of this font, in arrival order
};

/// The JSON events of a catalog, turned into its compact form.
class CatalogReader : public nlohmann::json_sax<nlohmann::json> {
public:
    CatalogReader(ByteSource& source, std::vector<QZCatalogProblem>& problems)
        : source_(source), problems_(problems), storage_(std::make_shared<CatalogStorage>()) {}

    /// The catalog once every event was seen; empty when the text was not a catalog.
    QZDownloadableFontCatalog Finish(bool parsed);

    // Scalars.
    bool null() override { return Scalar(false, {}); }
    bool boolean(bool) override { return Scalar(false, {}); }
    bool number_integer(number_integer_t value) override {
        return Size(value >= 0, uint64_t(value));
    }
    bool number_unsigned(number_unsigned_t value) override {
        return Size(value <= uint64_t(std::numeric_limits<int64_t>::max()), value);
    }
    bool number_float(number_float_t, const string_t&) override { return Size(false, 0); }
    bool string(string_t& value) override { return Scalar(true, value); }
    bool binary(binary_t&) override { return Scalar(false, {}); }

    // Containers.
    bool start_object(std::size_t) override;
    bool end_object() override;
    bool start_array(std::size_t) override;
    bool end_array() override;
    bool key(string_t& name) override;
    bool parse_error(std::size_t, const std::string&,
                     const nlohmann::detail::exception& error) override {
        AddProblem(QZCatalogProblem::Kind::Malformed, error.what());
        return false;
    }

private:
    /// Where the reader is: the container whose members or elements come next.
    enum class Context { Top, Root, Assets, Asset, Fonts, Font, Names, Skip };
    /// The member whose value comes next.
    enum class Member {
        Other,
        Assets,
        LocalID,
        URL,
        Size,
        SHA256,
        Fonts,
        PostScriptName,
        Family,
        Names,
        Name
    };

    bool Scalar(bool isString, std::string_view text);
    bool Size(bool valid, uint64_t value);
    /// A value arrives in the current context: a string (`isString`, with `text`), another
    /// scalar, or the start of a container that opens `container` (Skip: of no interest).
    void Place(bool isString, std::string_view text, Context container);
    void PlaceAssetMember(bool isString, std::string_view text, Context container);
    void PlaceFontMember(bool isString, std::string_view text, Context container);
    void StartAsset();
    void EndAsset();
    void EndFont();
    /// The reason an asset is left out, or empty when it is kept.
    std::string AssetProblem() const;
    void AddProblem(QZCatalogProblem::Kind kind, std::string message, size_t line = 0,
                    size_t column = 0);

    ByteSource& source_;
    std::vector<QZCatalogProblem>& problems_;
    std::shared_ptr<CatalogStorage> storage_;
    std::vector<QZDownloadableFontAsset> assets_;
    std::vector<std::pair<size_t, size_t>> fontRanges_; ///< per asset: first font, count
    std::vector<std::pair<size_t, size_t>> nameRanges_; ///< per kept font: first name, count
    std::unordered_set<std::string_view> identifiers_;

    std::vector<Context> stack_{Context::Top};
    Member member_ = Member::Other;
    std::string_view language_; ///< the key of the localized name that comes next
    size_t skipDepth_ = 0;
    bool assetsIsArray_ = false; ///< as of the last "assets" member

    // The asset being read.
    size_t assetIndex_ = 0;
    size_t assetLine_ = 0, assetColumn_ = 0;
    StringArena::Mark assetMark_;
    Seen localID_ = Seen::Absent, url_ = Seen::Absent, size_ = Seen::Absent;
    Seen sha256_ = Seen::Absent, fontsMember_ = Seen::Absent;
    QZDownloadableFontAsset asset_;
    std::vector<FontRecord> fonts_;
    std::string fontProblem_; ///< the first malformed font's reason
};

bool CatalogReader::start_object(std::size_t) {
    if (skipDepth_ > 0) {
        ++skipDepth_;
        return true;
    }
    const Context top = stack_.back();
    Context opened = Context::Skip;
    if (top == Context::Top)
        opened = Context::Root;
    else if (top == Context::Assets)
        opened = Context::Asset;
    else if (top == Context::Fonts)
        opened = Context::Font;
    else if (top == Context::Font && member_ == Member::Names)
        opened = Context::Names;
    Place(false, {}, opened);
    if (opened == Context::Skip) {
        skipDepth_ = 1;
        return true;
    }
    stack_.push_back(opened);
    if (opened == Context::Asset)
        StartAsset();
    else if (opened == Context::Font)
        fonts_.emplace_back().namesBegin = storage_->names.size();
    member_ = Member::Other;
    return true;
}

bool CatalogReader::end_object() {
    if (skipDepth_ > 0) {
        --skipDepth_;
        return true;
    }
    const Context closed = stack_.back();
    stack_.pop_back();
    if (closed == Context::Asset)
        EndAsset();
    else if (closed == Context::Font)
        EndFont();
    return true;
}

bool CatalogReader::start_array(std::size_t) {
    if (skipDepth_ > 0) {
        ++skipDepth_;
        return true;
    }
    const Context top = stack_.back();
    Context opened = Context::Skip;
    if (top == Context::Root && member_ == Member::Assets)
        opened = Context::Assets;
    else if (top == Context::Asset && member_ == Member::Fonts)
        opened = Context::Fonts;
    Place(false, {}, opened);
    if (opened == Context::Skip) {
        skipDepth_ = 1;
        return true;
    }
    stack_.push_back(opened);
    if (opened == Context::Assets) {
        // A later "assets" member replaces an earlier one, as in a JSON object.
        assets_.clear();
        fontRanges_.clear();
        identifiers_.clear();
        assetIndex_ = 0;
        std::erase_if(problems_, [](const QZCatalogProblem& problem) {
            return problem.kind == QZCatalogProblem::Kind::Asset;
        });
    }
    return true;
}

bool CatalogReader::end_array() {
    if (skipDepth_ > 0) {
        --skipDepth_;
        return true;
    }
    stack_.pop_back();
    return true;
}

bool CatalogReader::key(string_t& name) {
    if (skipDepth_ > 0)
        return true;
    member_ = Member::Other;
    switch (stack_.back()) {
    case Context::Root:
        if (name == "assets") {
            member_ = Member::Assets;
            assetsIsArray_ = false;
        }
        break;
    case Context::Asset:
        if (name == "LocalID")
            member_ = Member::LocalID, localID_ = Seen::Absent;
        else if (name == "url")
            member_ = Member::URL, url_ = Seen::Absent;
        else if (name == "size")
            member_ = Member::Size, size_ = Seen::Absent;
        else if (name == "sha256")
            member_ = Member::SHA256, sha256_ = Seen::Absent;
        else if (name == "fonts") {
            member_ = Member::Fonts;
            fontsMember_ = Seen::Absent;
            fonts_.clear();
            fontProblem_.clear();
        }
        break;
    case Context::Font: {
        FontRecord& font = fonts_.back();
        if (name == "postScriptName") {
            member_ = Member::PostScriptName;
            font.postScriptName = Seen::Absent;
        } else if (name == "family") {
            member_ = Member::Family;
            font.family = Seen::Absent;
        } else if (name == "localizedFamilyNames") {
            member_ = Member::Names;
            font.names = Seen::Absent;
            storage_->names.resize(font.namesBegin);
            font.nameValid.clear();
        }
        break;
    }
    case Context::Names:
        member_ = Member::Name;
        language_ = storage_->strings.Store(name);
        break;
    default:
        break;
    }
    return true;
}

bool CatalogReader::Scalar(bool isString, std::string_view text) {
    if (skipDepth_ == 0)
        Place(isString, text, Context::Skip);
    return true;
}

bool CatalogReader::Size(bool valid, uint64_t value) {
    if (skipDepth_ > 0)
        return true;
    if (stack_.back() == Context::Asset && member_ == Member::Size) {
        size_ = valid ? Seen::Valid : Seen::Invalid;
        asset_.size = value;
        return true;
    }
    Place(false, {}, Context::Skip);
    return true;
}

void CatalogReader::Place(bool isString, std::string_view text, Context container) {
    switch (stack_.back()) {
    case Context::Root:
        if (member_ == Member::Assets)
            assetsIsArray_ = container == Context::Assets;
        break;
    case Context::Assets:
        if (container != Context::Asset) {
            // An element that is not an object is an asset of its own, left out.
            StartAsset();
            AddProblem(QZCatalogProblem::Kind::Asset, "not an object", assetLine_, assetColumn_);
            ++assetIndex_;
        }
        break;
    case Context::Asset:
        PlaceAssetMember(isString, text, container);
        break;
    case Context::Fonts:
        if (container != Context::Font) {
            FontRecord& font = fonts_.emplace_back();
            font.postScriptName = Seen::Invalid;
            font.namesBegin = storage_->names.size();
            EndFont();
        }
        break;
    case Context::Font:
        PlaceFontMember(isString, text, container);
        break;
    case Context::Names:
        storage_->names.push_back(
            {language_, isString ? storage_->strings.Store(text) : std::string_view{}});
        fonts_.back().nameValid.push_back(isString);
        break;
    default:
        break;
    }
}

void CatalogReader::PlaceAssetMember(bool isString, std::string_view text, Context container) {
    const auto check = [&](Seen& seen, std::string_view& stored, bool valid) {
        seen = valid ? Seen::Valid : Seen::Invalid;
        if (valid)
            stored = storage_->strings.Store(text);
    };
    if (member_ == Member::LocalID)
        check(localID_, asset_.localID, isString && !text.empty());
    else if (member_ == Member::URL)
        check(url_, asset_.url, isString && !text.empty());
    else if (member_ == Member::SHA256)
        check(sha256_, asset_.sha256, isString && IsSHA256(text));
    else if (member_ == Member::Size)
        size_ = Seen::Invalid; // numbers arrive through Size()
    else if (member_ == Member::Fonts)
        fontsMember_ = container == Context::Fonts ? Seen::Valid : Seen::Invalid;
}

void CatalogReader::PlaceFontMember(bool isString, std::string_view text, Context container) {
    FontRecord& font = fonts_.back();
    if (member_ == Member::PostScriptName) {
        font.postScriptName = isString && !text.empty() ? Seen::Valid : Seen::Invalid;
        if (font.postScriptName == Seen::Valid)
            font.postScriptNameText = storage_->strings.Store(text);
    } else if (member_ == Member::Family) {
        font.family = isString ? Seen::Valid : Seen::Invalid;
        if (isString)
            font.familyText = storage_->strings.Store(text);
    } else if (member_ == Member::Names) {
        font.names = container == Context::Names ? Seen::Valid : Seen::Invalid;
    }
}

void CatalogReader::StartAsset() {
    assetLine_ = source_.Line();
    assetColumn_ = source_.Column() > 1 ? source_.Column() - 1 : 1;
    assetMark_ = storage_->strings.GetMark();
    localID_ = url_ = size_ = sha256_ = fontsMember_ = Seen::Absent;
    asset_ = {};
    fonts_.clear();
    fontProblem_.clear();
}

void CatalogReader::EndFont() {
    FontRecord& font = fonts_.back();
    std::string reason;
    if (font.postScriptName != Seen::Valid)
        reason = "a font without a \"postScriptName\"";
    else if (font.family == Seen::Invalid)
        reason = "a \"family\" that is not a string";
    else if (font.names == Seen::Invalid)
        reason = "\"localizedFamilyNames\" that is not an object";
    if (!reason.empty() && fontProblem_.empty())
        fontProblem_ = reason;
    if (!reason.empty() || font.names != Seen::Valid)
        return;
    std::vector<QZLocalizedName>& names = storage_->names;
    const auto first = names.begin() + std::ptrdiff_t(font.namesBegin);
    const auto valid =
        std::find(font.nameValid.begin(), font.nameValid.end(), false) == font.nameValid.end();
    if (valid && std::adjacent_find(first, names.end(), [](const auto& a, const auto& b) {
                     return a.language >= b.language;
                 }) == names.end()) {
        // The usual case: languages already in order, each once.
        font.namesCount = size_t(names.end() - first);
        font.nameValid.clear();
        return;
    }
    // Sorted by language, the last of equal languages kept, as a JSON object reads.
    std::vector<size_t> order(names.size() - font.namesBegin);
    for (size_t i = 0; i < order.size(); ++i)
        order[i] = i;
    std::stable_sort(order.begin(), order.end(), [&](size_t a, size_t b) {
        return names[font.namesBegin + a].language < names[font.namesBegin + b].language;
    });
    std::vector<QZLocalizedName> kept;
    std::vector<bool> keptValid;
    for (size_t i = 0; i < order.size(); ++i) {
        const QZLocalizedName& name = names[font.namesBegin + order[i]];
        if (!kept.empty() && kept.back().language == name.language) {
            kept.back() = name;
            keptValid.back() = font.nameValid[order[i]];
        } else {
            kept.push_back(name);
            keptValid.push_back(font.nameValid[order[i]]);
        }
    }
    if (std::find(keptValid.begin(), keptValid.end(), false) != keptValid.end() &&
        fontProblem_.empty())
        fontProblem_ = "a localized family name that is not a string";
    names.resize(font.namesBegin);
    names.insert(names.end(), kept.begin(), kept.end());
    font.namesCount = kept.size();
    font.nameValid.clear();
}

std::string CatalogReader::AssetProblem() const {
    if (localID_ != Seen::Valid)
        return "no \"LocalID\"";
    if (url_ != Seen::Valid)
        return "no \"url\"";
    if (size_ != Seen::Valid)
        return "no \"size\" in bytes";
    if (sha256_ != Seen::Valid)
        return "no \"sha256\" of 64 lower-case hexadecimal digits";
    if (fontsMember_ != Seen::Valid || fonts_.empty())
        return "no \"fonts\"";
    if (!fontProblem_.empty())
        return fontProblem_;
    if (identifiers_.count(asset_.localID))
        return "duplicate \"LocalID\" " + std::string(asset_.localID);
    return {};
}

void CatalogReader::EndAsset() {
    const std::string problem = AssetProblem();
    if (!problem.empty()) {
        AddProblem(QZCatalogProblem::Kind::Asset, problem, assetLine_, assetColumn_);
        // The rejected asset's strings and fonts are given back; its names follow its fonts.
        if (!fonts_.empty())
            storage_->names.resize(fonts_.front().namesBegin);
        storage_->strings.Rewind(assetMark_);
    } else {
        identifiers_.insert(asset_.localID);
        fontRanges_.emplace_back(storage_->fonts.size(), fonts_.size());
        for (const FontRecord& font : fonts_) {
            storage_->fonts.push_back({font.postScriptNameText, font.familyText, {}, {}});
            nameRanges_.emplace_back(font.namesBegin, font.namesCount);
        }
        assets_.push_back(asset_);
    }
    fonts_.clear();
    ++assetIndex_;
}

void CatalogReader::AddProblem(QZCatalogProblem::Kind kind, std::string message, size_t line,
                               size_t column) {
    problems_.push_back({kind, line, column, assetIndex_, std::move(message)});
}

QZDownloadableFontCatalog CatalogReader::Finish(bool parsed) {
    QZDownloadableFontCatalog catalog;
    if (source_.ReadFailed() || source_.TooLarge()) {
        AddProblem(QZCatalogProblem::Kind::Unreadable,
                   source_.TooLarge()
                       ? "larger than " + std::to_string(kMaximumCatalogSize) + " bytes"
                       : std::strerror(EIO));
        return catalog;
    }
    if (!parsed)
        return catalog;
    if (!assetsIsArray_) {
        AddProblem(QZCatalogProblem::Kind::Malformed, "no \"assets\" array");
        return catalog;
    }
    // The fonts and names are complete: the views can be made now.
    CatalogStorage& storage = *storage_;
    storage.fonts.shrink_to_fit();
    storage.names.shrink_to_fit();
    for (size_t i = 0; i < storage.fonts.size(); ++i)
        storage.fonts[i].localizedFamilyNames = std::span<const QZLocalizedName>(
            storage.names.data() + nameRanges_[i].first, nameRanges_[i].second);
    for (size_t i = 0; i < assets_.size(); ++i)
        assets_[i].fonts = std::span<const QZDownloadableFont>(
            storage.fonts.data() + fontRanges_[i].first, fontRanges_[i].second);
    assets_.shrink_to_fit();
    catalog.assets = std::move(assets_);
    catalog.storage = std::move(storage_);
    return catalog;
}

QZDownloadableFontCatalog Read(ByteSource& source, std::vector<QZCatalogProblem>& problems) {
    CatalogReader reader(source, problems);
    const bool parsed = nlohmann::json::sax_parse(ByteIterator(&source), ByteIterator(), &reader);
    return reader.Finish(parsed);
}

} // namespace

std::string_view QZDownloadableFont::LocalizedFamilyName(std::string_view language) const {
    const auto found =
        std::lower_bound(localizedFamilyNames.begin(), localizedFamilyNames.end(), language,
                         [](const QZLocalizedName& name, std::string_view wanted) {
                             return name.language < wanted;
                         });
    return found != localizedFamilyNames.end() && found->language == language ? found->name
                                                                              : std::string_view{};
}

QZDownloadableFontCatalog QZReadDownloadableFontCatalog(std::string_view bytes,
                                                        std::vector<QZCatalogProblem>& problems) {
    ByteSource source(bytes);
    return Read(source, problems);
}

QZDownloadableFontCatalog
QZReadDownloadableFontCatalogFile(const std::string& path,
                                  std::vector<QZCatalogProblem>& problems) {
    FILE* file = std::fopen(path.c_str(), "rbe");
    struct stat status {};
    if (!file || fstat(fileno(file), &status) != 0) {
        problems.push_back({QZCatalogProblem::Kind::Unreadable, 0, 0, 0, std::strerror(errno)});
        if (file)
            std::fclose(file);
        return {};
    }
    QZDownloadableFontCatalog catalog;
    if (size_t(status.st_size) > kMaximumCatalogSize) {
        problems.push_back({QZCatalogProblem::Kind::Unreadable, 0, 0, 0,
                            "larger than " + std::to_string(kMaximumCatalogSize) + " bytes"});
    } else {
        ByteSource source(file);
        catalog = Read(source, problems);
    }
    std::fclose(file);
    return catalog;
}
