#include "cfutil/CFURLComponents.h"

#include <string>
#include <string_view>
#include <utility>

#include "cfutil/CFStringUtilities.h"
#include "cfutil/TCFRetained.h"

namespace {

bool IsAlpha(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

bool IsDigit(char c) {
    return c >= '0' && c <= '9';
}

/// scheme = alpha *( alpha | digit | "+" | "-" | "." )
bool IsScheme(std::string_view text) {
    if (text.empty() || !IsAlpha(text[0]))
        return false;
    for (char c : text)
        if (!IsAlpha(c) && !IsDigit(c) && c != '+' && c != '-' && c != '.')
            return false;
    return true;
}

/// Replaces `*field` with a new string of `text`; false when the string cannot be made.
bool SetString(CFStringRef* field, std::string_view text) {
    CFStringRef string = glyphwell::CreateString(text);
    TCFSafeRelease(*field);
    *field = string;
    return string != nullptr;
}

void Clear(TCFURLComponentsRFC2396* components) {
    for (CFTypeRef* field : {(CFTypeRef*)&components->scheme, (CFTypeRef*)&components->userInfo,
                             (CFTypeRef*)&components->host, (CFTypeRef*)&components->pathComponents,
                             (CFTypeRef*)&components->parameterString,
                             (CFTypeRef*)&components->query, (CFTypeRef*)&components->fragment}) {
        TCFSafeRelease(*field);
        *field = nullptr;
    }
    components->port = 0;
}

/// Splits the authority into user info, host and port; false for a malformed port.
bool SplitAuthority(std::string_view authority, TCFURLComponentsRFC2396* components) {
    size_t at = authority.rfind('@');
    if (at != std::string_view::npos) {
        if (!SetString(&components->userInfo, authority.substr(0, at)))
            return false;
        authority.remove_prefix(at + 1);
    }
    // The port follows the last ":" that is not inside an IPv6 literal "[...]".
    size_t colon = authority.rfind(':');
    size_t bracket = authority.rfind(']');
    components->port = kCFNotFound;
    if (colon != std::string_view::npos && (bracket == std::string_view::npos || colon > bracket)) {
        std::string_view digits = authority.substr(colon + 1);
        authority = authority.substr(0, colon);
        if (!digits.empty()) {
            if (digits.size() > 10)
                return false;
            long long port = 0;
            for (char c : digits) {
                if (!IsDigit(c))
                    return false;
                port = port * 10 + (c - '0');
            }
            if (port > 0x7fffffff)
                return false;
            components->port = CFIndex(port);
        }
    }
    return SetString(&components->host, authority);
}

/// Fills the path components from `path`; false when a component cannot be made.
bool SplitPath(std::string_view path, TCFURLComponentsRFC2396* components) {
    CFMutableArrayRef array = CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks);
    if (!array)
        return false;
    components->pathComponents = array;
    if (path.empty())
        return true;
    for (;;) {
        size_t slash = path.find('/');
        TCFAdopted<CFStringRef> component(glyphwell::CreateString(path.substr(0, slash)));
        if (!component)
            return false;
        CFArrayAppendValue(array, component);
        if (slash == std::string_view::npos)
            return true;
        path.remove_prefix(slash + 1);
    }
}

bool Decompose(std::string_view text, TCFURLComponentsRFC2396* components) {
    size_t schemeEnd = text.find_first_of(":/?#");
    if (schemeEnd == std::string_view::npos || text[schemeEnd] != ':' ||
        !IsScheme(text.substr(0, schemeEnd)))
        return false;
    if (!SetString(&components->scheme, text.substr(0, schemeEnd)))
        return false;
    text.remove_prefix(schemeEnd + 1);

    size_t hash = text.find('#');
    if (hash != std::string_view::npos) {
        if (!SetString(&components->fragment, text.substr(hash + 1)))
            return false;
        text = text.substr(0, hash);
    }
    size_t question = text.find('?');
    if (question != std::string_view::npos) {
        if (!SetString(&components->query, text.substr(question + 1)))
            return false;
        text = text.substr(0, question);
    }

    bool hasAuthority = text.substr(0, 2) == "//";
    components->port = kCFNotFound;
    if (hasAuthority) {
        text.remove_prefix(2);
        size_t pathStart = text.find('/');
        if (!SplitAuthority(text.substr(0, pathStart), components))
            return false;
        text = pathStart == std::string_view::npos ? std::string_view() : text.substr(pathStart);
    } else if (!text.empty() && text[0] != '/') {
        return false; // opaque: no hierarchy to decompose
    }

    size_t semicolon = text.find(';');
    if (semicolon != std::string_view::npos) {
        if (!SetString(&components->parameterString, text.substr(semicolon + 1)))
            return false;
        text = text.substr(0, semicolon);
    }
    return SplitPath(text, components);
}

/// Appends the UTF-8 text of `string`; false when it has none.
bool Append(std::string& text, CFStringRef string) {
    std::string bytes;
    if (!CFString::GetUTF8(string, bytes))
        return false;
    text += bytes;
    return true;
}

} // namespace

TCFURLComponentsRFC2396::~TCFURLComponentsRFC2396() {
    Clear(this);
}

Boolean CFURLCopyComponents(CFURLRef url, CFURLComponentDecomposition decompositionType,
                            TCFURLComponentsRFC2396* components) {
    if (!components)
        return false;
    Clear(components);
    if (!url || decompositionType != kCFURLComponentDecompositionRFC2396)
        return false;
    TCFAdopted<CFURLRef> absolute(CFURLCopyAbsoluteURL(url));
    std::string text;
    if (!absolute || !CFString::GetUTF8(CFURLGetString(absolute), text) ||
        !Decompose(text, components)) {
        Clear(components);
        return false;
    }
    return true;
}

CFURLRef CFURLCreateFromComponents(CFAllocatorRef allocator,
                                   CFURLComponentDecomposition decompositionType,
                                   const TCFURLComponentsRFC2396* components) {
    if (!components || !components->scheme ||
        decompositionType != kCFURLComponentDecompositionRFC2396)
        return nullptr;

    std::string path;
    CFIndex count = components->pathComponents ? CFArrayGetCount(components->pathComponents) : 0;
    for (CFIndex i = 0; i < count; ++i) {
        if (i > 0)
            path += '/';
        auto component =
            static_cast<CFStringRef>(CFArrayGetValueAtIndex(components->pathComponents, i));
        if (!component || CFGetTypeID(component) != CFStringGetTypeID() || !Append(path, component))
            return nullptr;
    }

    std::string text;
    if (!Append(text, components->scheme))
        return nullptr;
    text += ':';
    bool hasAuthority = components->userInfo || components->host || components->port > 0;
    if (hasAuthority && !path.empty() && path[0] != '/')
        return nullptr; // the path would run into the host
    if (hasAuthority || path.compare(0, 2, "//") == 0) {
        text += "//";
        if (components->userInfo) {
            if (!Append(text, components->userInfo))
                return nullptr;
            text += '@';
        }
        if (components->host && !Append(text, components->host))
            return nullptr;
        if (components->port > 0)
            text += ':' + std::to_string(components->port);
    }
    text += path;
    const std::pair<char, CFStringRef> suffixes[] = {
        {';', components->parameterString}, {'?', components->query}, {'#', components->fragment}};
    for (const auto& [separator, part] : suffixes) {
        if (!part)
            continue;
        text += separator;
        if (!Append(text, part))
            return nullptr;
    }
    return CFURLCreateWithBytes(allocator, reinterpret_cast<const UInt8*>(text.data()),
                                CFIndex(text.size()), kCFStringEncodingUTF8, nullptr);
}
