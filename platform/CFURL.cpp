// URLs: the reference text exactly as given (UTF-8) and an optional base URL. uriparser checks
// that the text is an RFC 3986 reference and resolves it against its base; the parts of a
// reference are found with the RFC's own split (appendix B), which is exact for valid text.
#include "platform/CFURL.h"
#include <algorithm>

#include <uriparser/Uri.h>

#include <unistd.h>

#include <cerrno>
#include <climits>
#include <string>
#include <string_view>
#include <vector>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/Log.h"
#include "platform/TextCodec.h"

using namespace glyphwell::runtime;
namespace text = glyphwell::text;

namespace {

/// One part of a reference: bytes [begin, end) of its text, when present.
struct Part {
    size_t begin = 0;
    size_t end = 0;
    bool present = false;
};

struct Parts {
    Part scheme, authority, path, query, fragment;
};

/// Splits a valid reference into its parts (RFC 3986 appendix B). The path is always present,
/// possibly empty.
Parts Split(std::string_view s) {
    Parts parts;
    size_t i = 0;
    size_t colon = s.find_first_of(":/?#");
    if (colon != std::string_view::npos && colon > 0 && s[colon] == ':') {
        parts.scheme = {0, colon, true};
        i = colon + 1;
    }
    if (s.substr(i, 2) == "//") {
        size_t end = std::min(s.find_first_of("/?#", i + 2), s.size());
        parts.authority = {i + 2, end, true};
        i = end;
    }
    size_t pathEnd = std::min(s.find_first_of("?#", i), s.size());
    parts.path = {i, pathEnd, true};
    i = pathEnd;
    if (i < s.size() && s[i] == '?') {
        size_t end = std::min(s.find('#', i + 1), s.size());
        parts.query = {i + 1, end, true};
        i = end;
    }
    if (i < s.size() && s[i] == '#')
        parts.fragment = {i + 1, s.size(), true};
    return parts;
}

std::string_view PartOf(std::string_view s, const Part& part) {
    return s.substr(part.begin, part.end - part.begin);
}

bool EqualsIgnoringASCIICase(std::string_view a, std::string_view b) {
    if (a.size() != b.size())
        return false;
    for (size_t i = 0; i < a.size(); ++i) {
        auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? char(c + ('a' - 'A')) : c; };
        if (lower(a[i]) != lower(b[i]))
            return false;
    }
    return true;
}

/// A reference parsed by uriparser; the text must outlive it.
class ParsedReference {
public:
    explicit ParsedReference(std::string_view text) {
        const char* errorPosition = nullptr;
        ok_ = uriParseSingleUriExA(&uri_, text.data(), text.data() + text.size(), &errorPosition) ==
              URI_SUCCESS;
    }
    ~ParsedReference() {
        if (ok_)
            uriFreeUriMembersA(&uri_);
    }
    ParsedReference(const ParsedReference&) = delete;
    ParsedReference& operator=(const ParsedReference&) = delete;

    bool ok() const { return ok_; }
    const UriUriA* uri() const { return &uri_; }

private:
    UriUriA uri_{};
    bool ok_ = false;
};

/// Resolves `reference` against `base` (RFC 3986 section 5.2) into `out`. RFC resolution needs
/// a base with a scheme: a relative base borrows a placeholder scheme that is taken off again.
bool Resolve(std::string_view reference, std::string_view base, std::string& out) {
    static constexpr std::string_view kPlaceholder = "x-glyphwell-relative-base:";
    bool placeholder = !Split(base).scheme.present;
    std::string baseText =
        placeholder ? std::string(kPlaceholder) + std::string(base) : std::string(base);
    if (reference.size() + baseText.size() > INT_MAX / 2)
        return false;
    ParsedReference parsedReference(reference), parsedBase(baseText);
    if (!parsedReference.ok() || !parsedBase.ok())
        return false;
    UriUriA resolved;
    if (uriAddBaseUriExA(&resolved, parsedReference.uri(), parsedBase.uri(),
                         URI_RESOLVE_STRICTLY) != URI_SUCCESS)
        return false;
    int length = 0;
    bool ok = uriToStringCharsRequiredA(&resolved, &length) == URI_SUCCESS;
    if (ok) {
        out.assign(size_t(length) + 1, '\0');
        ok = uriToStringA(out.data(), &resolved, length + 1, nullptr) == URI_SUCCESS;
        out.resize(size_t(length));
    }
    uriFreeUriMembersA(&resolved);
    if (ok && placeholder && std::string_view(out).substr(0, kPlaceholder.size()) == kPlaceholder)
        out.erase(0, kPlaceholder.size());
    return ok;
}

// ---------------------------------------------------------------------------------------------
// Percent-encoding.

int HexValue(char c) {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    return -1;
}

/// The byte of the escape "%XX" at `position` of `s`, or -1 when there is none.
int EscapedByte(std::string_view s, size_t position) {
    if (position + 3 > s.size() || s[position] != '%')
        return -1;
    int high = HexValue(s[position + 1]), low = HexValue(s[position + 2]);
    return high < 0 || low < 0 ? -1 : high << 4 | low;
}

/// Appends `bytes` to `out`, percent-encoding every byte that may not stand as is in a URL
/// path: all but the unreserved characters, '/', and the delimiters "!$&'()*+,=:@" (';' is
/// encoded, it once separated path parameters). With `relative`, ':' is encoded in the first
/// segment too, where it would read as the end of a scheme.
void AppendEncodedPath(std::string_view bytes, bool relative, std::string& out) {
    static constexpr std::string_view kKept = "-._~/!$&'()*+,=@";
    static constexpr char kHex[] = "0123456789ABCDEF";
    bool firstSegment = relative;
    for (char c : bytes) {
        auto byte = static_cast<unsigned char>(c);
        if (c == '/')
            firstSegment = false;
        bool alphanumeric =
            (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
        if (alphanumeric || (c != '\0' && kKept.find(c) != std::string_view::npos) ||
            (c == ':' && !firstSegment)) {
            out += c;
        } else {
            out += '%';
            out += kHex[byte >> 4];
            out += kHex[byte & 15];
        }
    }
}

/// Replaces every "%XX" of `s` by its byte; false on a malformed escape.
bool PercentDecode(std::string_view s, std::string& out) {
    out.clear();
    for (size_t i = 0; i < s.size(); ++i) {
        if (s[i] != '%') {
            out += s[i];
            continue;
        }
        int byte = EscapedByte(s, i);
        if (byte < 0)
            return false;
        out += char(byte);
        i += 2;
    }
    return true;
}

/// Decoded text as a new string, or null when it is not decodable or not UTF-8.
CFStringRef CreateDecodedString(std::string_view s) {
    std::string decoded;
    if (!PercentDecode(s, decoded))
        return nullptr;
    return CFStringCreateWithBytes(kCFAllocatorDefault,
                                   reinterpret_cast<const UInt8*>(decoded.data()),
                                   CFIndex(decoded.size()), kCFStringEncodingUTF8, false);
}

/// The UTF-8 form of `string`; false for null or an unpaired surrogate.
bool UTF8Of(CFStringRef string, std::string& out,
            const glyphwell::runtime::SourceLocation& where =
                glyphwell::runtime::SourceLocation::current()) {
    CheckArgument(string != nullptr, "string != nullptr", where);
    if (!string)
        return false;
    std::optional<std::string> bytes = glyphwell::UTF8String(string);
    if (!bytes)
        return false;
    out = std::move(*bytes);
    return true;
}

/// "." and ".." segments taken out of `path` (RFC 3986 section 5.2.4). A relative path keeps
/// the leading ".." segments it cannot resolve, since dropping them would change its meaning.
std::string RemoveDotSegments(std::string_view path) {
    bool absolute = !path.empty() && path[0] == '/';
    std::string_view rest = absolute ? path.substr(1) : path;
    std::vector<std::string_view> segments;
    for (;;) {
        size_t slash = rest.find('/');
        std::string_view segment = rest.substr(0, slash);
        bool last = slash == std::string_view::npos;
        if (segment == "..") {
            if (!segments.empty() && segments.back() != "..")
                segments.pop_back();
            else if (!absolute)
                segments.push_back(segment);
        }
        if (segment == "." || segment == "..") {
            if (last)
                segments.push_back(""); // "a/b/.." names the directory "a/"
        } else {
            segments.push_back(segment);
        }
        if (last)
            break;
        rest.remove_prefix(slash + 1);
    }
    std::string out = absolute ? "/" : "";
    for (size_t i = 0; i < segments.size(); ++i) {
        if (i > 0)
            out += '/';
        out += segments[i];
    }
    if (!absolute && out.empty() && !path.empty())
        out = "./"; // the relative path resolved to its own directory
    return out;
}

} // namespace

// ---------------------------------------------------------------------------------------------
// The URL object.

struct __CFURL final : public CFObject {
    /// Takes `text` (a valid UTF-8 reference) and retains `base`.
    __CFURL(std::string text, CFURLRef base)
        : CFObject(kURLKind), text(std::move(text)), parts(Split(this->text)),
          base(base ? static_cast<CFURLRef>(CFRetain(base)) : nullptr),
          string(glyphwell::CreateString(this->text)) {}
    ~__CFURL() override {
        if (base)
            CFRelease(base);
        if (string)
            CFRelease(string);
    }

    bool Equals(const CFObject& other) const override {
        const auto& that = static_cast<const __CFURL&>(other);
        return text == that.text && CFEqual(base, that.base);
    }
    /// FNV-1a over the own text.
    CFHashCode Hash() const override {
        CFHashCode h = 0xcbf29ce484222325ULL;
        for (char c : text)
            h = (h ^ static_cast<unsigned char>(c)) * 0x100000001b3ULL;
        return h;
    }
    std::string Description() const override {
        return base ? text + " -- " + AsObject(base)->Description() : text;
    }

    std::string_view Slice(const Part& part) const { return PartOf(text, part); }

    const std::string text;
    const Parts parts;
    const CFURLRef base;
    const CFStringRef string; ///< `text` as a string, for CFURLGetString
};

namespace {

const __CFURL* Get(CFURLRef url, const glyphwell::runtime::SourceLocation& where =
                                     glyphwell::runtime::SourceLocation::current()) {
    const __CFURL* object = As<__CFURL>(url, kURLKind);
    CheckArgument(object != nullptr, "object != nullptr", where);
    return object;
}

/// A new URL for `text` relative to `base`; null when `text` is not UTF-8 or not a reference.
/// A reference with a scheme is absolute already: the base is not kept.
CFURLRef CreateURL(std::string text, CFURLRef base,
                   const glyphwell::runtime::SourceLocation& where =
                       glyphwell::runtime::SourceLocation::current()) {
    CheckArgument(base == nullptr || CFGetTypeID(base) == kURLKind,
                  "base == nullptr || CFGetTypeID(base) == kURLKind", where);
    if (base && CFGetTypeID(base) != kURLKind)
        base = nullptr;
    if (!text::IsValidUTF8(reinterpret_cast<const uint8_t*>(text.data()), text.size()))
        return nullptr;
    // International text (an IRI) becomes its URI: each byte of a non-ASCII character is
    // percent-encoded (RFC 3987, section 3.1), so that such a URL is kept, not refused.
    if (std::any_of(text.begin(), text.end(), [](char c) { return (unsigned char)c >= 0x80; })) {
        static const char digits[] = "0123456789ABCDEF";
        std::string encoded;
        for (char c : text) {
            const unsigned char byte = static_cast<unsigned char>(c);
            if (byte < 0x80) {
                encoded += c;
            } else {
                encoded += '%';
                encoded += digits[byte >> 4];
                encoded += digits[byte & 15];
            }
        }
        text = std::move(encoded);
    }
    if (!ParsedReference(text).ok())
        return nullptr;
    if (Split(text).scheme.present)
        base = nullptr;
    return new __CFURL(std::move(text), base);
}

/// The text of the URL resolved against its base, and the base's base, ...
std::string AbsoluteText(const __CFURL* url) {
    if (!url->base)
        return url->text;
    std::string resolved;
    if (!Resolve(url->text, AbsoluteText(Get(url->base)), resolved))
        return url->text; // cannot happen for valid texts; keep the URL's own text
    return resolved;
}

/// The decoded file-system path of the reference `text`, without a trailing slash (but "/").
/// False unless `text` is a file URL on the local host or has no scheme, or when its path has
/// a malformed escape or a zero byte.
bool FileSystemPathOf(std::string_view text, std::string& path) {
    Parts parts = Split(text);
    if (parts.scheme.present && !EqualsIgnoringASCIICase(PartOf(text, parts.scheme), "file"))
        return false;
    if (parts.authority.present) {
        std::string_view host = PartOf(text, parts.authority);
        if (!host.empty() && !EqualsIgnoringASCIICase(host, "localhost"))
            return false;
    }
    if (!PercentDecode(PartOf(text, parts.path), path) || path.find('\0') != std::string::npos)
        return false;
    if (path.size() > 1 && path.back() == '/')
        path.pop_back();
    return true;
}

CFURLRef CopyCurrentDirectoryURL();

/// A new URL for the POSIX path `path` (bytes), relative to `base` or the current directory.
CFURLRef CreateWithPathBytes(std::string_view path, bool isDirectory, CFURLRef base) {
    if (path.empty() || path.find('\0') != std::string_view::npos)
        return nullptr;
    std::string adjusted(path);
    if (isDirectory && adjusted.back() != '/')
        adjusted += '/';
    else if (!isDirectory && adjusted.size() > 1 && adjusted.back() == '/')
        adjusted.pop_back();
    if (adjusted[0] == '/') {
        std::string text = "file://";
        AppendEncodedPath(adjusted, false, text);
        return CreateURL(std::move(text), nullptr);
    }
    std::string text;
    AppendEncodedPath(adjusted, true, text);
    CFURLRef directory = base ? static_cast<CFURLRef>(CFRetain(base)) : CopyCurrentDirectoryURL();
    CFURLRef url = CreateURL(std::move(text), directory);
    if (directory)
        CFRelease(directory);
    return url;
}

/// The current directory as a file URL ending with '/'; null when it cannot be found.
CFURLRef CopyCurrentDirectoryURL() {
    std::vector<char> buffer(PATH_MAX);
    while (!getcwd(buffer.data(), buffer.size())) {
        if (errno != ERANGE)
            return nullptr;
        buffer.resize(buffer.size() * 2);
    }
    std::string_view directory(buffer.data());
    if (directory.empty() || directory[0] != '/')
        return nullptr; // "(unreachable)" and the like
    return CreateWithPathBytes(directory, true, nullptr);
}

/// A new URL like `url` with its own path replaced by `path`.
CFURLRef CreateWithPath(const __CFURL* url, std::string_view path) {
    std::string text = url->text.substr(0, url->parts.path.begin);
    text += path;
    text += std::string_view(url->text).substr(url->parts.path.end);
    return CreateURL(std::move(text), url->base);
}

/// The query or fragment `part`, escapes replaced except those of `charactersToLeaveEscaped`
/// (none replaced when it is null).
CFStringRef CopyEscapedPart(const __CFURL* url, const Part& part,
                            CFStringRef charactersToLeaveEscaped) {
    if (!part.present)
        return nullptr;
    CFStringRef raw = glyphwell::CreateString(url->Slice(part));
    if (!charactersToLeaveEscaped || !raw)
        return raw;
    CFStringRef decoded = CFURLCreateStringByReplacingPercentEscapes(kCFAllocatorDefault, raw,
                                                                     charactersToLeaveEscaped);
    CFRelease(raw);
    return decoded;
}

} // namespace

CFTypeID CFURLGetTypeID() {
    return kURLKind;
}

// ---------------------------------------------------------------------------------------------
// Creation.

CFURLRef CFURLCreateWithBytes(CFAllocatorRef, const UInt8* bytes, CFIndex length,
                              CFStringEncoding encoding, CFURLRef baseURL) {
    GW_CHECK_ARGUMENT(length >= 0 && (bytes != nullptr || length == 0));
    if (length < 0 || (!bytes && length != 0))
        return nullptr;
    std::string text;
    if (encoding == kCFStringEncodingUTF8) {
        text.assign(reinterpret_cast<const char*>(bytes), size_t(length));
    } else {
        std::u16string units;
        if (!text::Decode(bytes, size_t(length), encoding, false, units) ||
            !text::EncodeUTF8(units, text))
            return nullptr;
    }
    return CreateURL(std::move(text), baseURL);
}

CFURLRef CFURLCreateWithString(CFAllocatorRef, CFStringRef string, CFURLRef baseURL) {
    std::string text;
    return UTF8Of(string, text) ? CreateURL(std::move(text), baseURL) : nullptr;
}

CFURLRef CFURLCreateWithFileSystemPath(CFAllocatorRef allocator, CFStringRef path,
                                       CFURLPathStyle style, Boolean isDirectory) {
    return CFURLCreateWithFileSystemPathRelativeToBase(allocator, path, style, isDirectory,
                                                       nullptr);
}

CFURLRef CFURLCreateWithFileSystemPathRelativeToBase(CFAllocatorRef, CFStringRef path,
                                                     CFURLPathStyle style, Boolean isDirectory,
                                                     CFURLRef baseURL) {
    GW_CHECK_ARGUMENT(style == kCFURLPOSIXPathStyle);
    std::string bytes;
    if (style != kCFURLPOSIXPathStyle || !UTF8Of(path, bytes))
        return nullptr;
    return CreateWithPathBytes(bytes, isDirectory, baseURL);
}

CFURLRef CFURLCreateFromFileSystemRepresentation(CFAllocatorRef, const UInt8* buffer,
                                                 CFIndex length, Boolean isDirectory) {
    GW_CHECK_ARGUMENT(length >= 0 && (buffer != nullptr || length == 0));
    if (length <= 0 || !buffer)
        return nullptr;
    return CreateWithPathBytes(
        std::string_view(reinterpret_cast<const char*>(buffer), size_t(length)), isDirectory,
        nullptr);
}

CFURLRef CFURLCopyAbsoluteURL(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return nullptr;
    if (!object->base)
        return static_cast<CFURLRef>(CFRetain(url));
    return new __CFURL(AbsoluteText(object), nullptr);
}

// ---------------------------------------------------------------------------------------------
// Access.

CFIndex CFURLGetBytes(CFURLRef url, UInt8* buffer, CFIndex bufferLength) {
    const __CFURL* object = Get(url);
    if (!object)
        return 0;
    CFIndex length = CFIndex(object->text.size());
    if (!buffer)
        return length;
    if (length > bufferLength)
        return -1;
    object->text.copy(reinterpret_cast<char*>(buffer), object->text.size());
    return length;
}

CFStringRef CFURLGetString(CFURLRef url) {
    const __CFURL* object = Get(url);
    return object ? object->string : nullptr;
}

CFURLRef CFURLGetBaseURL(CFURLRef url) {
    const __CFURL* object = Get(url);
    return object ? object->base : nullptr;
}

CFStringRef CFURLCopyScheme(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return nullptr;
    std::string absolute = AbsoluteText(object);
    Parts parts = Split(absolute);
    return parts.scheme.present ? glyphwell::CreateString(PartOf(absolute, parts.scheme)) : nullptr;
}

CFStringRef CFURLCopyHostName(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return nullptr;
    std::string absolute = AbsoluteText(object);
    Parts parts = Split(absolute);
    if (!parts.authority.present)
        return nullptr;
    std::string_view host = PartOf(absolute, parts.authority);
    size_t at = host.rfind('@');
    if (at != std::string_view::npos)
        host.remove_prefix(at + 1);
    if (!host.empty() && host[0] == '[') // an IP literal, without its brackets
        host = host.substr(1, host.find(']') - 1);
    else
        host = host.substr(0, host.find(':'));
    if (host.empty())
        return nullptr;
    CFStringRef decoded = CreateDecodedString(host);
    return decoded ? decoded : glyphwell::CreateString(host);
}

CFStringRef CFURLCopyFileSystemPath(CFURLRef url, CFURLPathStyle style) {
    const __CFURL* object = Get(url);
    GW_CHECK_ARGUMENT(style == kCFURLPOSIXPathStyle);
    std::string path;
    if (!object || style != kCFURLPOSIXPathStyle || !FileSystemPathOf(AbsoluteText(object), path))
        return nullptr;
    return glyphwell::CreateString(path); // null when the path is not UTF-8
}

CFStringRef CFURLCopyPath(CFURLRef url) {
    const __CFURL* object = Get(url);
    return object ? glyphwell::CreateString(object->Slice(object->parts.path)) : nullptr;
}

CFStringRef CFURLCopyLastPathComponent(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return nullptr;
    std::string absolute = AbsoluteText(object);
    std::string_view path = PartOf(absolute, Split(absolute).path);
    if (path.size() > 1 && path.back() == '/')
        path.remove_suffix(1);
    if (path != "/")
        path = path.substr(path.rfind('/') + 1); // npos + 1 is 0: the whole path
    CFStringRef decoded = CreateDecodedString(path);
    return decoded ? decoded : glyphwell::CreateString(path);
}

CFStringRef CFURLCopyQueryString(CFURLRef url, CFStringRef charactersToLeaveEscaped) {
    const __CFURL* object = Get(url);
    return object ? CopyEscapedPart(object, object->parts.query, charactersToLeaveEscaped)
                  : nullptr;
}

CFStringRef CFURLCopyFragment(CFURLRef url, CFStringRef charactersToLeaveEscaped) {
    const __CFURL* object = Get(url);
    return object ? CopyEscapedPart(object, object->parts.fragment, charactersToLeaveEscaped)
                  : nullptr;
}

Boolean CFURLGetFileSystemRepresentation(CFURLRef url, Boolean resolveAgainstBase, UInt8* buffer,
                                         CFIndex maxBufLen) {
    const __CFURL* object = Get(url);
    GW_CHECK_ARGUMENT(buffer != nullptr);
    std::string path;
    if (!object || !buffer ||
        !FileSystemPathOf(resolveAgainstBase ? AbsoluteText(object) : object->text, path) ||
        maxBufLen < 1 || path.size() > size_t(maxBufLen - 1))
        return false;
    path.copy(reinterpret_cast<char*>(buffer), path.size());
    buffer[path.size()] = 0;
    return true;
}

Boolean CFURLHasDirectoryPath(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return false;
    std::string_view path = object->Slice(object->parts.path);
    if (path.empty() && object->base) // an empty reference names its base's resource
        return CFURLHasDirectoryPath(object->base);
    return !path.empty() && path.back() == '/';
}

Boolean CFURLCanBeDecomposed(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return false;
    std::string absolute = AbsoluteText(object);
    Parts parts = Split(absolute);
    std::string_view path = PartOf(absolute, parts.path);
    return !parts.scheme.present || parts.authority.present || (!path.empty() && path[0] == '/');
}

CFURLRef CFURLCreateCopyAppendingPathComponent(CFAllocatorRef, CFURLRef url, CFStringRef component,
                                               Boolean isDirectory) {
    const __CFURL* object = Get(url);
    std::string bytes;
    if (!object || !UTF8Of(component, bytes))
        return nullptr;
    const Parts& parts = object->parts;
    std::string path(object->Slice(parts.path));
    bool firstOfRelative = !parts.scheme.present && !parts.authority.present && path.empty();
    if (!path.empty() && path.back() != '/')
        path += '/';
    else if (path.empty() && parts.authority.present)
        path = "/";
    AppendEncodedPath(bytes, firstOfRelative, path);
    if (isDirectory && !path.empty() && path.back() != '/')
        path += '/';
    return CreateWithPath(object, path);
}

CFURLRef CFURLCreateCopyDeletingLastPathComponent(CFAllocatorRef, CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return nullptr;
    std::string path(object->Slice(object->parts.path));
    if (path.empty() && object->parts.authority.present)
        path = "/";
    if (path == "/")
        return CreateWithPath(object, path); // the root has no parent
    std::string_view trimmed = path;
    if (!trimmed.empty() && trimmed.back() == '/')
        trimmed.remove_suffix(1);
    size_t slash = trimmed.rfind('/');
    std::string_view last = slash == std::string_view::npos ? trimmed : trimmed.substr(slash + 1);
    std::string parent;
    if (path.empty() || last == "." || last == "..") // going up needs another ".."
        parent = path + (path.empty() || path.back() == '/' ? "" : "/") + "../";
    else
        parent = slash == std::string_view::npos ? "./" : std::string(trimmed.substr(0, slash + 1));
    return CreateWithPath(object, parent);
}

CFURLRef CFURLCreateStandardizedURL(CFURLRef url) {
    const __CFURL* object = Get(url);
    if (!object)
        return nullptr;
    std::string path = RemoveDotSegments(object->Slice(object->parts.path));
    // Without an authority, a path must not start with "//" (it would read as one); without a
    // scheme either, its first segment must not hold ':' (it would read as a scheme).
    if (!object->parts.authority.present && path.compare(0, 2, "//") == 0)
        path.insert(0, "/.");
    else if (!object->parts.authority.present && !object->parts.scheme.present &&
             path.find(':') < path.find('/'))
        path.insert(0, "./");
    return CreateWithPath(object, path);
}

CFStringRef CFURLCreateStringByReplacingPercentEscapes(CFAllocatorRef, CFStringRef string,
                                                       CFStringRef charactersToLeaveEscaped) {
    std::string in;
    if (!UTF8Of(string, in))
        return nullptr;
    if (!charactersToLeaveEscaped)
        return CFStringCreateCopy(kCFAllocatorDefault, string);
    std::u16string_view keep(
        reinterpret_cast<const char16_t*>(CFStringGetCharactersPtr(charactersToLeaveEscaped)),
        size_t(CFStringGetLength(charactersToLeaveEscaped)));
    std::string out;
    for (size_t i = 0; i < in.size();) {
        if (in[i] != '%') {
            out += in[i++];
            continue;
        }
        int lead = EscapedByte(in, i);
        if (lead < 0)
            return nullptr;
        // Gather the escapes of one UTF-8 character, to test it against the characters to keep.
        size_t expected = lead < 0xC0 ? 1 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
        std::string bytes(1, char(lead));
        size_t next = i + 3;
        for (int byte; bytes.size() < expected && (byte = EscapedByte(in, next)) >= 0; next += 3)
            bytes += char(byte);
        std::u16string character;
        bool keepEscaped = text::Decode(reinterpret_cast<const uint8_t*>(bytes.data()),
                                        bytes.size(), kCFStringEncodingUTF8, false, character) &&
                           !character.empty() && keep.find(character) != std::u16string::npos;
        out += keepEscaped ? in.substr(i, next - i) : bytes;
        i = next;
    }
    return glyphwell::CreateString(out); // null when the decoded bytes are not UTF-8
}
