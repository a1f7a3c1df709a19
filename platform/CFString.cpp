// Strings in one of two forms. An immutable string made from ASCII or well-formed UTF-8 keeps
// those bytes (right after the object, in the same allocation) and makes its UTF-16 units only
// when a caller asks for them; every other string, and every mutable one, holds UTF-16 units.
// Both forms hash and compare as their UTF-16 units, so the same text is equal across forms.
// Conversions live in TextCodec.
#include "platform/CFString.h"

#include <algorithm>
#include <atomic>
#include <climits>
#include <cstdarg>
#include <cstring>
#include <memory>
#include <mutex>
#include <new>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/Log.h"
#include "platform/TextCodec.h"

using namespace glyphwell::runtime;
namespace text = glyphwell::text;

namespace {

/// Calls `unit(u)` for each UTF-16 unit of `utf8`, which must be well-formed; stops and returns
/// false as soon as `unit` returns false.
template <class F> bool ForEachUnit(std::string_view utf8, F&& unit) {
    const auto* p = reinterpret_cast<const uint8_t*>(utf8.data());
    const auto* const end = p + utf8.size();
    while (p < end) {
        uint32_t c = *p;
        if (c < 0x80) {
            p += 1;
        } else if (c < 0xE0) {
            c = (c & 0x1F) << 6 | (p[1] & 0x3Fu);
            p += 2;
        } else if (c < 0xF0) {
            c = (c & 0x0F) << 12 | (p[1] & 0x3Fu) << 6 | (p[2] & 0x3Fu);
            p += 3;
        } else {
            c = (c & 0x07) << 18 | (p[1] & 0x3Fu) << 12 | (p[2] & 0x3Fu) << 6 | (p[3] & 0x3Fu);
            p += 4;
            c -= 0x10000;
            if (!unit(char16_t(0xD800 + (c >> 10))))
                return false;
            c = 0xDC00 + (c & 0x3FF);
        }
        if (!unit(char16_t(c)))
            return false;
    }
    return true;
}

constexpr CFHashCode kHashStart = 0xcbf29ce484222325ULL;
constexpr CFHashCode kHashPrime = 0x100000001b3ULL;

} // namespace

struct __CFString final : public CFObject {
    /// How the text is held: UTF-16 units, or the 8-bit bytes it was made from.
    enum class Form : uint8_t { UTF16, ASCII, UTF8 };

    /// A string holding UTF-16 units.
    __CFString(std::u16string units, bool isMutable)
        : CFObject(kStringKind), units(std::move(units)), form(Form::UTF16), isMutable(isMutable) {}

    /// A new immutable string of `count` 8-bit bytes (ASCII, or UTF-8 with some non-ASCII) that
    /// make `length` UTF-16 units. The bytes are left for the caller to write at MutableBytes();
    /// their terminating zero is written here.
    static __CFString* Allocate8Bit(size_t count, size_t length, Form form) {
        void* memory = ::operator new(sizeof(__CFString) + count + 1);
        auto* object = new (memory) __CFString(count, length, form);
        object->MutableBytes()[count] = '\0';
        return object;
    }
    /// Every string is freed unsized: an 8-bit one is larger than the class.
    static void operator delete(void* memory) { ::operator delete(memory); }

    ~__CFString() override {
        if (Is8Bit())
            delete narrow.wide.load(std::memory_order_acquire);
        else
            units.~basic_string();
    }

    bool Is8Bit() const { return form != Form::UTF16; }
    /// The 8-bit form's bytes, zero-terminated. Only for an 8-bit string.
    const char* Bytes() const { return reinterpret_cast<const char*>(this + 1); }
    char* MutableBytes() { return reinterpret_cast<char*>(this + 1); }
    std::string_view Narrow() const { return {Bytes(), narrow.byteCount}; }
    size_t ByteCount() const { return narrow.byteCount; }
    /// Length in UTF-16 units.
    size_t Length() const { return form == Form::UTF16 ? units.size() : narrow.length; }

    /// The UTF-16 units. An 8-bit string makes them on first demand and keeps them, unchanged,
    /// for its life; threads racing to make them agree on one copy (the others are freed).
    std::u16string_view Wide() const {
        if (form == Form::UTF16)
            return units;
        const std::u16string* made = narrow.wide.load(std::memory_order_acquire);
        return made ? *made : *MakeWide();
    }

    bool Equals(const CFObject& other) const override {
        return SameText(*this, static_cast<const __CFString&>(other));
    }
    /// FNV-1a over the UTF-16 units, whatever the form. An immutable string computes it once and
    /// keeps it, so that every dictionary it becomes a key of does not hash it again; a mutable
    /// one computes it each time.
    CFHashCode Hash() const override {
        // Relaxed is enough: every thread computes the same value, and 0 means "not yet" (a
        // string whose hash is 0 just computes it each time). A mutable string never stores it.
        const CFHashCode h = cachedHash.load(std::memory_order_relaxed);
        return h != 0 ? h : ComputeHash();
    }
    std::string Description() const override {
        return Is8Bit() ? std::string(Narrow()) : text::EncodeUTF8Lossy(units);
    }

    /// Computes the hash, and keeps it when the string is immutable. Out of line, so that the
    /// kept hash is returned without setting up the loops.
    __attribute__((noinline)) CFHashCode ComputeHash() const {
        const CFHashCode h = HashUnits();
        if (!isMutable)
            cachedHash.store(h, std::memory_order_relaxed);
        return h;
    }

    CFHashCode HashUnits() const {
        CFHashCode h = kHashStart;
        switch (form) {
        case Form::UTF16:
            for (char16_t unit : units)
                h = (h ^ unit) * kHashPrime;
            break;
        case Form::ASCII:
            for (char byte : Narrow())
                h = (h ^ uint8_t(byte)) * kHashPrime;
            break;
        case Form::UTF8:
            ForEachUnit(Narrow(), [&h](char16_t unit) {
                h = (h ^ unit) * kHashPrime;
                return true;
            });
            break;
        }
        return h;
    }

    /// Whether `a` and `b` hold the same UTF-16 units.
    static bool SameText(const __CFString& a, const __CFString& b) {
        if (a.Length() != b.Length())
            return false;
        if (a.Is8Bit() && b.Is8Bit()) // well-formed UTF-8 is equal exactly when its units are
            return a.Narrow() == b.Narrow();
        if (!a.Is8Bit() && !b.Is8Bit())
            return a.units == b.units;
        const __CFString& narrow = a.Is8Bit() ? a : b;
        const char16_t* unit = (a.Is8Bit() ? b : a).units.data();
        if (narrow.form == Form::ASCII) {
            for (char byte : narrow.Narrow())
                if (*unit++ != uint8_t(byte))
                    return false;
            return true;
        }
        // Equal lengths: the decoded units never run past the other string's.
        return ForEachUnit(narrow.Narrow(),
                           [&unit](char16_t decoded) { return *unit++ == decoded; });
    }

    /// What the 8-bit form knows of its bytes, which follow the object.
    struct NarrowText {
        size_t byteCount; ///< bytes kept, without the terminating zero
        size_t length;    ///< UTF-16 units they make
        /// The UTF-16 units once made, else null. Published once, never changed.
        mutable std::atomic<const std::u16string*> wide;
    };
    // One form or the other; `form` says which, and the destructor ends the right one.
    union {
        std::u16string units; ///< the UTF-16 form's units
        NarrowText narrow;    ///< the 8-bit form's
    };
    const Form form;
    const bool isMutable;
    /// The hash of an immutable string once computed, else 0. Immutable strings are shared
    /// between threads (the uniquer's, constants), hence atomic.
    mutable std::atomic<CFHashCode> cachedHash{0};

private:
    __CFString(size_t count, size_t length, Form form)
        : CFObject(kStringKind), narrow{count, length, {nullptr}}, form(form), isMutable(false) {}

    const std::u16string* MakeWide() const {
        auto made = std::make_unique<std::u16string>();
        made->reserve(narrow.length);
        text::Decode(reinterpret_cast<const uint8_t*>(Bytes()), narrow.byteCount,
                     kCFStringEncodingUTF8, false, *made);
        const std::u16string* expected = nullptr;
        if (narrow.wide.compare_exchange_strong(expected, made.get(), std::memory_order_acq_rel,
                                                std::memory_order_acquire))
            return made.release();
        return expected; // another thread published first; ours is freed
    }
};

namespace {

using Form = __CFString::Form;

/// The string behind `string`; reports a null or foreign reference through the assertion
/// handler and returns null.
const __CFString* Get(CFStringRef string, const glyphwell::runtime::SourceLocation& where =
                                              glyphwell::runtime::SourceLocation::current()) {
    const __CFString* object = As<__CFString>(string, kStringKind);
    CheckArgument(object != nullptr, "object != nullptr", where);
    return object;
}

/// The mutable string behind `string`, or null (reported) when it is null or immutable.
__CFString* GetMutable(CFMutableStringRef string,
                       const glyphwell::runtime::SourceLocation& where =
                           glyphwell::runtime::SourceLocation::current()) {
    __CFString* object = AsMutable<__CFString>(string, kStringKind);
    CheckArgument(object != nullptr && object->isMutable, "object != nullptr && object->isMutable",
                  where);
    return object && object->isMutable ? object : nullptr;
}

/// True when `range` lies inside a string of `length` units; reported otherwise.
bool RangeInside(CFRange range, size_t length,
                 const glyphwell::runtime::SourceLocation& where =
                     glyphwell::runtime::SourceLocation::current()) {
    return CheckRange(range, CFIndex(length), where, "range lies inside the string");
}

/// Whether the `length` bytes at `bytes` are all below 0x80; eight at a time.
bool AllASCII(const uint8_t* bytes, size_t length) {
    uint64_t any = 0;
    size_t i = 0;
    for (; i + 8 <= length; i += 8) {
        uint64_t word;
        std::memcpy(&word, bytes + i, 8);
        any |= word;
    }
    for (; i < length; ++i)
        any |= bytes[i];
    return (any & 0x8080808080808080ULL) == 0;
}

/// A new immutable string keeping the `count` ASCII bytes at `bytes`.
CFStringRef MakeASCII(const uint8_t* bytes, size_t count) {
    __CFString* object = __CFString::Allocate8Bit(count, count, Form::ASCII);
    if (count > 0)
        std::memcpy(object->MutableBytes(), bytes, count);
    return object;
}

/// A new immutable string keeping the `count` bytes at `bytes` when they are well-formed UTF-8;
/// null otherwise. Its UTF-16 length is counted once, here.
CFStringRef MakeUTF8(const uint8_t* bytes, size_t count) {
    if (AllASCII(bytes, count))
        return MakeASCII(bytes, count);
    if (!text::IsValidUTF8(bytes, count))
        return nullptr;
    // One unit per character, two for one beyond the BMP (its lead byte is F0 to F4).
    size_t length = 0;
    for (size_t i = 0; i < count; ++i)
        length += (bytes[i] & 0xC0) != 0x80 ? (bytes[i] >= 0xF0 ? 2 : 1) : 0;
    __CFString* object = __CFString::Allocate8Bit(count, length, Form::UTF8);
    std::memcpy(object->MutableBytes(), bytes, count);
    return object;
}

/// A new immutable string of `units`: kept as bytes when they are all ASCII.
CFStringRef Make(std::u16string units) {
    char16_t any = 0;
    for (char16_t unit : units)
        any |= unit;
    if (any >= 0x80)
        return new __CFString(std::move(units), false);
    __CFString* object = __CFString::Allocate8Bit(units.size(), units.size(), Form::ASCII);
    std::copy(units.begin(), units.end(), object->MutableBytes());
    return object;
}

/// A new immutable string of UTF-8 text that may be malformed (each bad byte becomes U+FFFD).
CFStringRef MakeLenient(std::string_view utf8) {
    if (CFStringRef string = MakeUTF8(reinterpret_cast<const uint8_t*>(utf8.data()), utf8.size()))
        return string;
    return Make(text::DecodeUTF8Lenient(utf8));
}

/// Appends the UTF-16 units of `object` to `out`.
void AppendUnits(std::u16string& out, const __CFString* object) {
    switch (object->form) {
    case Form::UTF16:
        out += object->units;
        break;
    case Form::ASCII:
        out.append(object->Bytes(), object->Bytes() + object->ByteCount());
        break;
    case Form::UTF8:
        text::Decode(reinterpret_cast<const uint8_t*>(object->Bytes()), object->ByteCount(),
                     kCFStringEncodingUTF8, false, out);
        break;
    }
}

/// The UTF-16 units of `object` (of none for null). An ASCII string's are made in `scratch`,
/// so that a passing use does not keep a UTF-16 copy with the string.
std::u16string_view Units(const __CFString* object, std::u16string& scratch) {
    if (!object)
        return {};
    if (object->form != Form::ASCII)
        return object->Wide();
    scratch.assign(object->Bytes(), object->Bytes() + object->ByteCount());
    return scratch;
}

/// Calls `f` with the text of `object` as it is held: ASCII bytes as a std::string_view, every
/// other form as a std::u16string_view of its units (made on demand for UTF-8).
template <class F> decltype(auto) VisitText(const __CFString* object, F&& f) {
    if (object && object->form == Form::ASCII)
        return f(object->Narrow());
    return f(object ? object->Wide() : std::u16string_view());
}

/// A unit of either view as UTF-16.
inline char16_t Unit(char c) {
    return char16_t(uint8_t(c));
}
inline char16_t Unit(char16_t c) {
    return c;
}

char16_t FoldASCII(char16_t unit) {
    return unit >= u'A' && unit <= u'Z' ? char16_t(unit + (u'a' - u'A')) : unit;
}

template <class A, class B> bool UnitsMatch(A a, B b, bool caseInsensitive) {
    for (size_t i = 0; i < a.size(); ++i) {
        char16_t x = Unit(a[i]), y = Unit(b[i]);
        if (caseInsensitive ? FoldASCII(x) != FoldASCII(y) : x != y)
            return false;
    }
    return true;
}

template <class A, class B>
CFComparisonResult CompareUnits(A a, B b, CFStringCompareFlags options) {
    bool fold = options & kCFCompareCaseInsensitive;
    size_t common = std::min(a.size(), b.size());
    for (size_t i = 0; i < common; ++i) {
        char16_t x = fold ? FoldASCII(Unit(a[i])) : Unit(a[i]);
        char16_t y = fold ? FoldASCII(Unit(b[i])) : Unit(b[i]);
        if (x != y)
            return x < y ? kCFCompareLessThan : kCFCompareGreaterThan;
    }
    if (a.size() == b.size())
        return kCFCompareEqualTo;
    return a.size() < b.size() ? kCFCompareLessThan : kCFCompareGreaterThan;
}

/// Constant strings: one immortal string per literal text, for the life of the process. The
/// table is built on first use and never destroyed, so constant strings may be made from the
/// static initialisers and destructors of any translation unit.
struct ConstantTable {
    std::mutex mutex;
    std::unordered_map<std::string, const __CFString*> strings;
};

ConstantTable& Constants() {
    static ConstantTable* table = new ConstantTable;
    return *table;
}

} // namespace

CFTypeID CFStringGetTypeID() {
    return kStringKind;
}

CFStringRef __CFStringMakeConstantString(const char* utf8) {
    GW_CHECK_ARGUMENT(utf8 != nullptr);
    if (!utf8)
        return nullptr;
    ConstantTable& table = Constants();
    std::lock_guard<std::mutex> lock(table.mutex);
    auto [slot, inserted] = table.strings.try_emplace(utf8, nullptr);
    if (inserted) {
        auto* string = const_cast<__CFString*>(MakeLenient(slot->first));
        string->MakeImmortal();
        slot->second = string;
    }
    return slot->second;
}

// ---------------------------------------------------------------------------------------------
// Creation.

CFStringRef CFStringCreateWithBytes(CFAllocatorRef, const UInt8* bytes, CFIndex numBytes,
                                    CFStringEncoding encoding, Boolean isExternalRepresentation) {
    GW_CHECK_ARGUMENT(numBytes >= 0 && (bytes != nullptr || numBytes == 0));
    if (numBytes < 0 || (!bytes && numBytes != 0))
        return nullptr;
    size_t count = size_t(numBytes);
    switch (encoding) {
    case kCFStringEncodingUTF8:
        // The bytes are kept as they are, less a leading byte-order mark when external.
        if (isExternalRepresentation && count >= 3 && bytes[0] == 0xEF && bytes[1] == 0xBB &&
            bytes[2] == 0xBF) {
            bytes += 3;
            count -= 3;
        }
        return MakeUTF8(bytes, count);
    case kCFStringEncodingASCII:
    case kCFStringEncodingISOLatin1:
    case kCFStringEncodingMacRoman:
        // These agree with ASCII below 0x80; only ASCII refuses a byte above.
        if (AllASCII(bytes, count))
            return MakeASCII(bytes, count);
        if (encoding == kCFStringEncodingASCII)
            return nullptr;
        break;
    default:
        break;
    }
    std::u16string units;
    if (!text::Decode(bytes, count, encoding, isExternalRepresentation, units))
        return nullptr;
    return Make(std::move(units));
}

CFStringRef CFStringCreateWithCString(CFAllocatorRef allocator, const char* cString,
                                      CFStringEncoding encoding) {
    GW_CHECK_ARGUMENT(cString != nullptr);
    if (!cString)
        return nullptr;
    return CFStringCreateWithBytes(allocator, reinterpret_cast<const UInt8*>(cString),
                                   CFIndex(std::strlen(cString)), encoding, false);
}

CFStringRef CFStringCreateWithCharacters(CFAllocatorRef, const UniChar* chars, CFIndex numChars) {
    if (!GW_CHECK_ARGUMENT(numChars >= 0 && (chars != nullptr || numChars == 0)))
        return nullptr;
    if (numChars == 0)
        return Make(std::u16string());
    return Make(std::u16string(reinterpret_cast<const char16_t*>(chars), size_t(numChars)));
}

CFStringRef CFStringCreateWithFileSystemRepresentation(CFAllocatorRef allocator,
                                                       const char* buffer) {
    return CFStringCreateWithCString(allocator, buffer, kCFStringEncodingUTF8);
}

CFStringRef CFStringCreateCopy(CFAllocatorRef, CFStringRef string) {
    const __CFString* object = Get(string);
    if (!object)
        return nullptr;
    if (!object->isMutable) // immutable strings are shared, not copied
        return static_cast<CFStringRef>(CFRetain(string));
    return Make(object->units);
}

CFStringRef CFStringCreateWithSubstring(CFAllocatorRef, CFStringRef string, CFRange range) {
    const __CFString* object = Get(string);
    if (!object)
        return nullptr;
    if (!RangeInside(range, object->Length()))
        return nullptr;
    const size_t start = size_t(range.location), count = size_t(range.length);
    if (object->form == Form::ASCII)
        return MakeASCII(reinterpret_cast<const uint8_t*>(object->Bytes()) + start, count);
    return Make(std::u16string(object->Wide().substr(start, count)));
}

CFStringRef CFStringCreateWithFormat(CFAllocatorRef, CFDictionaryRef, CFStringRef format, ...) {
    const __CFString* object = Get(format);
    if (!object)
        return nullptr;
    std::string utf8 = object->Description(); // the format's UTF-8, U+FFFD for lone surrogates
    va_list arguments;
    va_start(arguments, format);
    std::string formatted = glyphwell::FormatV(utf8.c_str(), arguments);
    va_end(arguments);
    return MakeLenient(formatted);
}

CFMutableStringRef CFStringCreateMutable(CFAllocatorRef, CFIndex maxLength) {
    if (!GW_CHECK_ARGUMENT(maxLength >= 0))
        return nullptr;
    return new __CFString(std::u16string(), true);
}

CFMutableStringRef CFStringCreateMutableCopy(CFAllocatorRef, CFIndex maxLength,
                                             CFStringRef string) {
    const __CFString* object = Get(string);
    if (!object || !GW_CHECK_ARGUMENT(maxLength >= 0))
        return nullptr;
    std::u16string units;
    units.reserve(object->Length());
    AppendUnits(units, object);
    return new __CFString(std::move(units), true);
}

// ---------------------------------------------------------------------------------------------
// Mutation. Mutable strings always hold UTF-16 units. Every operation on an immutable string,
// or with a range outside the string, is reported and changes nothing.

void CFStringAppend(CFMutableStringRef string, CFStringRef appended) {
    __CFString* object = GetMutable(string);
    const __CFString* tail = Get(appended);
    if (!object || !tail)
        return;
    if (tail == object) // appending a string to itself: += copies first
        object->units += std::u16string(object->units);
    else
        AppendUnits(object->units, tail);
}

void CFStringAppendCString(CFMutableStringRef string, const char* cString,
                           CFStringEncoding encoding) {
    __CFString* object = GetMutable(string);
    GW_CHECK_ARGUMENT(cString != nullptr);
    if (!object || !cString)
        return;
    std::u16string units;
    if (text::Decode(reinterpret_cast<const uint8_t*>(cString), std::strlen(cString), encoding,
                     false, units))
        object->units += units;
}

void CFStringAppendCharacters(CFMutableStringRef string, const UniChar* chars, CFIndex numChars) {
    __CFString* object = GetMutable(string);
    GW_CHECK_ARGUMENT(numChars >= 0 && (chars != nullptr || numChars == 0));
    if (object && chars && numChars > 0)
        object->units.append(reinterpret_cast<const char16_t*>(chars), size_t(numChars));
}

void CFStringReplace(CFMutableStringRef string, CFRange range, CFStringRef replacement) {
    __CFString* object = GetMutable(string);
    const __CFString* with = Get(replacement);
    if (!object || !with || !RangeInside(range, object->units.size()))
        return;
    std::u16string copy; // the replacement may be the string itself
    AppendUnits(copy, with);
    object->units.replace(size_t(range.location), size_t(range.length), copy);
}

void CFStringDelete(CFMutableStringRef string, CFRange range) {
    __CFString* object = GetMutable(string);
    if (object && RangeInside(range, object->units.size()))
        object->units.erase(size_t(range.location), size_t(range.length));
}

void CFStringInsert(CFMutableStringRef string, CFIndex index, CFStringRef inserted) {
    CFStringReplace(string, CFRangeMake(index, 0), inserted);
}

// ---------------------------------------------------------------------------------------------
// Access.

CFIndex CFStringGetLength(CFStringRef string) {
    const __CFString* object = Get(string);
    return object ? CFIndex(object->Length()) : 0;
}

UniChar CFStringGetCharacterAtIndex(CFStringRef string, CFIndex index) {
    const __CFString* object = Get(string);
    if (!object || !RangeInside(CFRangeMake(index, 1), object->Length()))
        return 0;
    if (object->form == Form::ASCII)
        return uint8_t(object->Bytes()[index]);
    return object->Wide()[size_t(index)];
}

void CFStringGetCharacters(CFStringRef string, CFRange range, UniChar* buffer) {
    const __CFString* object = Get(string);
    GW_CHECK_ARGUMENT(buffer != nullptr || range.length == 0);
    if (!object || !buffer || !RangeInside(range, object->Length()))
        return;
    if (object->form == Form::ASCII) {
        const char* bytes = object->Bytes() + range.location;
        std::copy(bytes, bytes + range.length, buffer);
        return;
    }
    std::memcpy(buffer, object->Wide().data() + range.location,
                size_t(range.length) * sizeof(UniChar));
}

/// An 8-bit string makes (and keeps) its UTF-16 units here.
const UniChar* CFStringGetCharactersPtr(CFStringRef string) {
    const __CFString* object = Get(string);
    return object ? reinterpret_cast<const UniChar*>(object->Wide().data()) : nullptr;
}

namespace {

/// Whether ASCII bytes are also the bytes of their text in `encoding`.
bool ASCIICompatible(CFStringEncoding encoding) {
    return encoding == kCFStringEncodingUTF8 || encoding == kCFStringEncodingASCII ||
           encoding == kCFStringEncodingISOLatin1 || encoding == kCFStringEncodingMacRoman;
}

/// Whether the bytes an 8-bit `object` keeps are its text in `encoding`.
bool KeepsBytesFor(const __CFString* object, CFStringEncoding encoding) {
    return (object->form == Form::ASCII && ASCIICompatible(encoding)) ||
           (object->form == Form::UTF8 && encoding == kCFStringEncodingUTF8);
}

} // namespace

CFIndex CFStringGetBytes(CFStringRef string, CFRange range, CFStringEncoding encoding,
                         UInt8 lossByte, Boolean isExternalRepresentation, UInt8* buffer,
                         CFIndex maxBufLen, CFIndex* usedBufLen) {
    if (usedBufLen)
        *usedBufLen = 0;
    const __CFString* object = Get(string);
    if (!object || !RangeInside(range, object->Length()))
        return 0;
    size_t capacity = maxBufLen > 0 ? size_t(maxBufLen) : 0;
    // Kept bytes are copied as they are: for ASCII, any range, as far as the buffer takes it;
    // for UTF-8, the whole text when it fits (a part goes through the units below).
    if (object->Is8Bit() && KeepsBytesFor(object, encoding)) {
        size_t count = object->form == Form::ASCII ? size_t(range.length) : object->ByteCount();
        bool whole = range.location == 0 && size_t(range.length) == object->Length();
        if (object->form == Form::ASCII || (whole && (!buffer || count <= capacity))) {
            if (buffer) {
                count = std::min(count, capacity);
                std::memcpy(buffer, object->Bytes() + range.location, count);
            }
            if (usedBufLen)
                *usedBufLen = CFIndex(count);
            return object->form == Form::ASCII ? CFIndex(count) : range.length;
        }
    }
    text::EncodeResult result;
    std::u16string scratch;
    std::u16string_view units =
        Units(object, scratch).substr(size_t(range.location), size_t(range.length));
    if (!text::Encode(units, encoding, lossByte, isExternalRepresentation, buffer, capacity,
                      result))
        return 0;
    if (usedBufLen)
        *usedBufLen = CFIndex(result.bytes);
    return CFIndex(result.unitsConverted);
}

Boolean CFStringGetCString(CFStringRef string, char* buffer, CFIndex bufferSize,
                           CFStringEncoding encoding) {
    const __CFString* object = Get(string);
    GW_CHECK_ARGUMENT(buffer != nullptr || bufferSize == 0);
    if (!object || !buffer || bufferSize <= 0)
        return false;
    // Room for the terminator is kept back from the conversion.
    const size_t room = size_t(bufferSize - 1);
    bool converted = false;
    size_t count = 0;
    if (object->Is8Bit() && KeepsBytesFor(object, encoding)) {
        count = object->ByteCount();
        converted = count <= room;
        if (converted)
            std::memcpy(buffer, object->Bytes(), count);
    } else {
        text::EncodeResult result;
        std::u16string scratch;
        std::u16string_view units = Units(object, scratch);
        converted = text::Encode(units, encoding, 0, false, reinterpret_cast<uint8_t*>(buffer),
                                 room, result) &&
                    result.unitsConverted == units.size();
        count = result.bytes;
    }
    buffer[converted ? count : 0] = '\0';
    return converted;
}

/// The kept bytes of an 8-bit string when they are its text in `encoding` and hold no zero byte
/// (which would cut the text short); null otherwise.
const char* CFStringGetCStringPtr(CFStringRef string, CFStringEncoding encoding) {
    const __CFString* object = Get(string);
    if (!object || !object->Is8Bit() || !KeepsBytesFor(object, encoding) ||
        std::memchr(object->Bytes(), 0, object->ByteCount()))
        return nullptr;
    return object->Bytes();
}

CFIndex CFStringGetMaximumSizeForEncoding(CFIndex length, CFStringEncoding encoding) {
    GW_CHECK_ARGUMENT(length >= 0);
    size_t perUnit = text::MaxBytesPerUnit(encoding);
    if (length < 0 || perUnit == 0 || size_t(length) > size_t(LONG_MAX) / perUnit)
        return kCFNotFound;
    return length * CFIndex(perUnit);
}

CFIndex CFStringGetMaximumSizeOfFileSystemRepresentation(CFStringRef string) {
    return 3 * CFStringGetLength(string) + 1;
}

Boolean CFStringGetFileSystemRepresentation(CFStringRef string, char* buffer, CFIndex maxBufLen) {
    const __CFString* object = Get(string);
    if (!object)
        return false;
    // A path cannot hold a zero byte: refuse rather than hand out a shortened path.
    bool hasZero = object->Is8Bit()
                       ? std::memchr(object->Bytes(), 0, object->ByteCount()) != nullptr
                       : object->units.find(u'\0') != std::u16string::npos;
    if (hasZero) {
        if (buffer && maxBufLen > 0)
            buffer[0] = '\0';
        return false;
    }
    return CFStringGetCString(string, buffer, maxBufLen, kCFStringEncodingUTF8);
}

// ---------------------------------------------------------------------------------------------
// Comparison and search. ASCII strings are compared as their bytes, without a UTF-16 copy.

CFComparisonResult CFStringCompare(CFStringRef a, CFStringRef b, CFStringCompareFlags options) {
    return VisitText(Get(a), [&](auto x) {
        return VisitText(Get(b), [&](auto y) { return CompareUnits(x, y, options); });
    });
}

CFComparisonResult CFStringCompareWithOptions(CFStringRef a, CFStringRef b, CFRange rangeToCompare,
                                              CFStringCompareFlags options) {
    return VisitText(Get(a), [&](auto units) {
        if (!RangeInside(rangeToCompare, units.size()))
            return kCFCompareLessThan;
        auto part = units.substr(size_t(rangeToCompare.location), size_t(rangeToCompare.length));
        return VisitText(Get(b), [&](auto other) { return CompareUnits(part, other, options); });
    });
}

namespace {

/// The search of CFStringFindWithOptions over `haystack`, the units of `rangeToSearch`.
template <class H, class N>
bool FindUnits(H haystack, N needle, CFRange rangeToSearch, CFStringCompareFlags options,
               CFRange* result) {
    if (needle.empty() || needle.size() > haystack.size())
        return false;
    const bool fold = options & kCFCompareCaseInsensitive;
    const bool backwards = options & kCFCompareBackwards;
    const bool anchored = options & kCFCompareAnchored;
    const size_t last = haystack.size() - needle.size(); // the last possible start
    // Anchored: only the first start (the last one when searching backwards) is tried.
    size_t first = backwards ? last : 0;
    size_t count = anchored ? 1 : last + 1;
    for (size_t step = 0; step < count; ++step) {
        size_t start = backwards ? first - step : first + step;
        if (UnitsMatch(haystack.substr(start, needle.size()), needle, fold)) {
            if (result)
                *result =
                    CFRangeMake(rangeToSearch.location + CFIndex(start), CFIndex(needle.size()));
            return true;
        }
    }
    return false;
}

} // namespace

Boolean CFStringFindWithOptions(CFStringRef string, CFStringRef toFind, CFRange rangeToSearch,
                                CFStringCompareFlags options, CFRange* result) {
    const __CFString* haystackObject = Get(string);
    const __CFString* needleObject = Get(toFind);
    if (!haystackObject || !needleObject || !RangeInside(rangeToSearch, haystackObject->Length()))
        return false;
    return VisitText(haystackObject, [&](auto units) {
        auto haystack = units.substr(size_t(rangeToSearch.location), size_t(rangeToSearch.length));
        return VisitText(needleObject, [&](auto needle) {
            return FindUnits(haystack, needle, rangeToSearch, options, result);
        });
    });
}

CFRange CFStringFind(CFStringRef string, CFStringRef toFind, CFStringCompareFlags options) {
    CFRange found{kCFNotFound, 0};
    CFStringFindWithOptions(string, toFind, CFRangeMake(0, CFStringGetLength(string)), options,
                            &found);
    return found;
}

Boolean CFStringHasPrefix(CFStringRef string, CFStringRef prefix) {
    return CFStringFindWithOptions(string, prefix, CFRangeMake(0, CFStringGetLength(string)),
                                   kCFCompareAnchored, nullptr);
}

Boolean CFStringHasSuffix(CFStringRef string, CFStringRef suffix) {
    return CFStringFindWithOptions(string, suffix, CFRangeMake(0, CFStringGetLength(string)),
                                   kCFCompareAnchored | kCFCompareBackwards, nullptr);
}

CFStringRef glyphwell::CreateString(std::string_view utf8) {
    return CFStringCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(utf8.data()),
                                   CFIndex(utf8.size()), kCFStringEncodingUTF8, false);
}

std::optional<std::string> glyphwell::UTF8String(CFStringRef string, UInt8 lossByte) {
    if (!string)
        return std::nullopt;
    const __CFString* object = Get(string);
    if (!object)
        return std::nullopt;
    if (object->Is8Bit())
        return std::string(object->Narrow());
    std::string bytes;
    if (text::EncodeUTF8(object->units, bytes))
        return bytes;
    if (lossByte == 0)
        return std::nullopt;
    text::EncodeResult result;
    text::Encode(object->units, kCFStringEncodingUTF8, lossByte, false, nullptr, 0, result);
    bytes.assign(result.bytes, '\0');
    text::Encode(object->units, kCFStringEncodingUTF8, lossByte, false,
                 reinterpret_cast<uint8_t*>(bytes.data()), bytes.size(), result);
    return bytes;
}

std::string_view glyphwell::UTF8Bytes(CFStringRef string) {
    const __CFString* object = As<__CFString>(string, kStringKind);
    if (!object || !object->Is8Bit())
        return {};
    return object->Narrow();
}
