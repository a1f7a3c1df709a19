#include "cfutil/TCFNumber.h"

#include <locale.h>
#include <stdlib.h>

#include "cfutil/TCFRetained.h"
#include "cfutil/TStackBuffer.h"

template <> CFNumberRef TCFNumber::Create<SInt8>(SInt8 value) {
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberCharType, &value);
}

template <> CFNumberRef TCFNumber::Create<SInt64>(SInt64 value) {
    static_assert(sizeof(SInt64) == sizeof(long), "kCFNumberLongType is 8 bytes");
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberLongType, &value);
}

template <> CFNumberRef TCFNumber::Create<double>(double value) {
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberDoubleType, &value);
}

template <> CFNumberRef TCFNumber::Create<bool>(bool value) {
    SInt32 integer = value ? 1 : 0;
    return CFNumberCreate(kCFAllocatorDefault, kCFNumberIntType, &integer);
}

CFNumberRef TCFNumber::CreateFromBoolean(bool flag) {
    // The pair is made once (the static's guard makes concurrent first calls safe) and holds
    // one count of each number for the rest of the process, so a count handed out never frees it.
    static const struct BooleanPair {
        CFNumberRef numbers[2];
        BooleanPair() {
            for (SInt32 value : {0, 1})
                numbers[value] =
                    CFNumberCreateCounted(kCFAllocatorDefault, kCFNumberIntType, &value);
        }
    } pair;
    return static_cast<CFNumberRef>(CFRetain(pair.numbers[flag ? 1 : 0]));
}

namespace {

/// The C locale, made once and never freed; null if the C library cannot make it.
locale_t CLocale() {
    static const locale_t locale = newlocale(LC_ALL_MASK, "C", locale_t(0));
    return locale;
}

} // namespace

CFNumberRef TCFNumber::CreateForString(CFStringRef string) {
    locale_t cLocale = CLocale();
    if (!string || !cLocale)
        return nullptr;
    // The byte count tells where the text really ends, so that a string holding U+0000 is not
    // read as the number before it.
    const std::optional<std::string> text = glyphwell::UTF8String(string);
    if (!text)
        return nullptr;
    const char* begin = text->c_str();
    const char* end = begin + text->size();

    char* stop = nullptr;
    long integer = strtol_l(begin, &stop, 10, cLocale); // saturates out of range; accepted
    if (stop != begin && stop == end)
        return Create<SInt64>(integer);
    double real = strtod_l(begin, &stop, cLocale);
    if (stop != begin && stop == end)
        return Create<double>(real);
    return nullptr;
}

template <> void TCFNumber::GetCFNumberValue<unsigned long>(CFTypeRef number, unsigned long& out) {
    if (number == kCFBooleanTrue) {
        out = 1;
        return;
    }
    if (number == kCFBooleanFalse) {
        out = 0;
        return;
    }
    SInt64 value = 0;
    if (number && CFGetTypeID(number) == CFNumberGetTypeID())
        CFNumberGetValue(static_cast<CFNumberRef>(number), kCFNumberLongType, &value);
    out = static_cast<unsigned long>(value);
}

template <>
bool TCFNumber::GetCFNumberValueSafely<unsigned long>(CFTypeRef value, unsigned long& out) {
    if (!value ||
        (CFGetTypeID(value) != CFNumberGetTypeID() && CFGetTypeID(value) != CFBooleanGetTypeID())) {
        out = 0;
        return false;
    }
    GetCFNumberValue(value, out);
    return true;
}
