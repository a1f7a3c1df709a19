// Test helpers: short ways to make property values and to compare bytes.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "platform/PropertyValues.h"

namespace glyphwell::testing {

/// Holds one reference and releases it at the end of the scope.
class Ref {
public:
    Ref() = default;
    explicit Ref(CFTypeRef value) : value_(value) {}
    Ref(Ref&& other) noexcept : value_(std::exchange(other.value_, nullptr)) {}
    Ref& operator=(Ref&& other) noexcept {
        std::swap(value_, other.value_);
        return *this;
    }
    Ref(const Ref&) = delete;
    ~Ref() {
        if (value_)
            CFRelease(value_);
    }
    CFTypeRef get() const { return value_; }
    template <class T> T as() const { return (T)(value_); }
    explicit operator bool() const { return value_ != nullptr; }

private:
    CFTypeRef value_ = nullptr;
};

/// `unit` written `times` times in a row.
inline std::string Repeat(const std::string& unit, size_t times) {
    std::string text;
    text.reserve(unit.size() * times);
    for (size_t i = 0; i < times; ++i)
        text += unit;
    return text;
}

inline Ref Str(const std::string& utf8) {
    return Ref(CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(utf8.data()),
                                       CFIndex(utf8.size()), kCFStringEncodingUTF8, false));
}

template <class T> Ref Num(CFNumberType type, T value) {
    return Ref(CFNumberCreate(nullptr, type, &value));
}

inline Ref Dict(std::initializer_list<std::pair<CFTypeRef, CFTypeRef>> pairs) {
    std::vector<const void*> keys, values;
    for (const auto& [key, value] : pairs) {
        keys.push_back(key);
        values.push_back(value);
    }
    return Ref(CFDictionaryCreate(nullptr, keys.data(), values.data(), CFIndex(keys.size()),
                                  &kCFTypeDictionaryKeyCallBacks,
                                  &kCFTypeDictionaryValueCallBacks));
}

inline Ref Array(std::initializer_list<CFTypeRef> items) {
    std::vector<const void*> values(items);
    return Ref(
        CFArrayCreate(nullptr, values.data(), CFIndex(values.size()), &kCFTypeArrayCallBacks));
}

inline Ref Set(std::initializer_list<CFTypeRef> items) {
    std::vector<const void*> values(items);
    return Ref(CFSetCreate(nullptr, values.data(), CFIndex(values.size()), &kCFTypeSetCallBacks));
}

/// UTF-8 text of a string value or of a URL's string, "<null>" for null.
inline std::string TextOf(CFTypeRef value) {
    if (!value)
        return "<null>";
    CFStringRef string = CFGetTypeID(value) == CFURLGetTypeID()
                             ? CFURLGetString(static_cast<CFURLRef>(value))
                             : static_cast<CFStringRef>(value);
    std::string buffer(size_t(CFStringGetMaximumSizeForEncoding(CFStringGetLength(string),
                                                                kCFStringEncodingUTF8)) +
                           1,
                       '\0');
    if (!CFStringGetCString(string, buffer.data(), CFIndex(buffer.size()), kCFStringEncodingUTF8))
        return "<?>";
    buffer.resize(std::char_traits<char>::length(buffer.c_str()));
    return buffer;
}

/// The texts of the elements of an array (none for null).
inline std::vector<std::string> Texts(CFTypeRef array) {
    std::vector<std::string> texts;
    for (CFIndex i = 0; array && i < CFArrayGetCount(static_cast<CFArrayRef>(array)); ++i)
        texts.push_back(TextOf(CFArrayGetValueAtIndex(static_cast<CFArrayRef>(array), i)));
    return texts;
}

/// The UTF-16 units of a string.
inline std::u16string Units(CFStringRef string) {
    std::u16string units(size_t(CFStringGetLength(string)), u'\0');
    CFStringGetCharacters(string, CFRangeMake(0, CFIndex(units.size())),
                          reinterpret_cast<UniChar*>(units.data()));
    return units;
}

/// Bytes from a hex text such as "00 00 00 07 61".
inline std::vector<uint8_t> Hex(const std::string& text) {
    std::vector<uint8_t> bytes;
    std::istringstream in(text);
    std::string pair;
    while (in >> pair)
        bytes.push_back(uint8_t(std::stoul(pair, nullptr, 16)));
    return bytes;
}

/// Upper-case hex with spaces, for readable failure messages.
inline std::string ToHex(const uint8_t* bytes, size_t length) {
    static const char digits[] = "0123456789ABCDEF";
    std::string text;
    for (size_t i = 0; i < length; ++i) {
        if (i)
            text += ' ';
        text += digits[bytes[i] >> 4];
        text += digits[bytes[i] & 15];
    }
    return text;
}

inline std::string ToHex(const std::vector<uint8_t>& bytes) {
    return ToHex(bytes.data(), bytes.size());
}

inline std::string ToHex(CFDataRef data) {
    return ToHex(CFDataGetBytePtr(data), size_t(CFDataGetLength(data)));
}

} // namespace glyphwell::testing
