#include "platform/CFNumber.h"

#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>
#include <new>

#include "platform/ArgumentChecks.h"
#include "platform/CFRuntime.h"
#include "platform/Log.h"

using glyphwell::runtime::CFObject;
using glyphwell::runtime::kBooleanKind;
using glyphwell::runtime::kNumberKind;
using glyphwell::runtime::MixHash;

namespace {

bool IsFloatType(CFNumberType type) {
    return type == kCFNumberFloat32Type || type == kCFNumberFloat64Type ||
           type == kCFNumberFloatType || type == kCFNumberDoubleType ||
           type == kCFNumberCGFloatType;
}

bool IsValidType(CFNumberType type) {
    return type >= 1 && type <= kCFNumberMaxType;
}

/// Exact three-way comparison of an integer with a double that is not NaN: no conversion that
/// could round takes place.
int CompareIntegerWithDouble(int64_t integer, double value) {
    constexpr double kTwoTo63 = 9223372036854775808.0;
    if (value >= kTwoTo63)
        return -1;
    if (value < -kTwoTo63)
        return 1;
    double whole = std::trunc(value); // inside the int64 range, so the cast below is exact
    int64_t wholeInteger = int64_t(whole);
    if (integer != wholeInteger)
        return integer < wholeInteger ? -1 : 1;
    double fraction = value - whole;
    return fraction > 0 ? -1 : fraction < 0 ? 1 : 0;
}

/// The number's value stored as a signed integer of `bits` bits: the low bits, and whether the
/// value fits.
template <class T> bool StoreInteger(int64_t value, void* out) {
    T narrowed = T(value); // modular since C++20
    std::memcpy(out, &narrowed, sizeof narrowed);
    return int64_t(narrowed) == value;
}

/// A double converted to integer type T: truncated toward zero, saturated at T's limits, NaN
/// gives 0. Exact only when nothing was cut.
template <class T> bool StoreFromDouble(double value, void* out) {
    using Limits = std::numeric_limits<T>;
    // -2^(bits-1) and 2^(bits-1) are exact doubles.
    const double low = double(Limits::min());
    const double high = -low;
    T result;
    bool exact;
    if (std::isnan(value)) {
        result = 0;
        exact = false;
    } else if (value >= high) {
        result = Limits::max();
        exact = false;
    } else if (value < low) {
        result = Limits::min();
        exact = false;
    } else {
        result = T(std::trunc(value));
        exact = std::trunc(value) == value;
    }
    std::memcpy(out, &result, sizeof result);
    return exact;
}

/// A double rounded to the nearest float. Doing the overflowing cast by hand keeps it defined:
/// beyond the float range the result is the largest float or infinity, as round-to-nearest gives.
float RoundToFloat(double value) {
    constexpr double kTwoTo128 = 340282366920938463463374607431768211456.0;
    constexpr float kMax = std::numeric_limits<float>::max();
    if (std::isnan(value) || std::isinf(value))
        return float(value);
    if (std::fabs(value) >= kTwoTo128) // at or past the halfway point above the largest float
        return std::copysign(std::numeric_limits<float>::infinity(), float(value > 0 ? 1 : -1));
    if (std::fabs(value) > kMax)
        return value > 0 ? kMax : -kMax;
    return float(value);
}

} // namespace

/// A number: integers of every type code are kept as int64, floating point as double (a float
/// keeps its exact value in a double). `type` is the code it was created with.
struct __CFNumber final : CFObject {
    __CFNumber(CFNumberType type, int64_t integer, bool immortal = false)
        : CFObject(kNumberKind, immortal), type(type), isFloat(false), integer(integer) {}
    __CFNumber(CFNumberType type, double real)
        : CFObject(kNumberKind), type(type), isFloat(true), real(real) {}

    bool Equals(const CFObject& other) const override;
    CFHashCode Hash() const override;
    std::string Description() const override;

    const CFNumberType type;
    const bool isFloat;
    union {
        int64_t integer;
        double real;
    };
};

/// Numeric order; NaN equals NaN and comes after every other number, so that the order agrees
/// with equality and numbers can be sorted and used as keys.
static CFComparisonResult CompareNumbers(const __CFNumber& a, const __CFNumber& b) {
    int order;
    if (!a.isFloat && !b.isFloat) {
        order = a.integer < b.integer ? -1 : a.integer > b.integer ? 1 : 0;
    } else if (a.isFloat && b.isFloat) {
        bool aNaN = std::isnan(a.real), bNaN = std::isnan(b.real);
        if (aNaN || bNaN)
            order = aNaN == bNaN ? 0 : aNaN ? 1 : -1;
        else
            order = a.real < b.real ? -1 : a.real > b.real ? 1 : 0;
    } else if (a.isFloat) {
        order = std::isnan(a.real) ? 1 : -CompareIntegerWithDouble(b.integer, a.real);
    } else {
        order = std::isnan(b.real) ? -1 : CompareIntegerWithDouble(a.integer, b.real);
    }
    return order < 0 ? kCFCompareLessThan : order > 0 ? kCFCompareGreaterThan : kCFCompareEqualTo;
}

bool __CFNumber::Equals(const CFObject& other) const {
    return CompareNumbers(*this, static_cast<const __CFNumber&>(other)) == kCFCompareEqualTo;
}

CFHashCode __CFNumber::Hash() const {
    if (!isFloat)
        return MixHash(0, CFHashCode(integer));
    if (std::isnan(real))
        return MixHash(0, 0x7ff8000000000000ULL);
    // An integral value inside the int64 range hashes like the integer it equals (-0.0 too).
    if (std::trunc(real) == real && real >= -9223372036854775808.0 && real < 9223372036854775808.0)
        return MixHash(0, CFHashCode(int64_t(real)));
    uint64_t bits;
    std::memcpy(&bits, &real, sizeof bits);
    return MixHash(0, CFHashCode(bits));
}

std::string __CFNumber::Description() const {
    char text[64];
    std::to_chars_result end;
    if (!isFloat)
        end = std::to_chars(text, text + sizeof text, integer);
    else if (CFNumberTypeByteSize(type) == 4) // shortest text that gives the float back
        end = std::to_chars(text, text + sizeof text, float(real));
    else
        end = std::to_chars(text, text + sizeof text, real);
    return std::string(text, end.ptr);
}

/// One of the two shared booleans.
struct __CFBoolean final : CFObject {
    explicit constexpr __CFBoolean(bool value) : CFObject(kBooleanKind, true), value(value) {}

    bool Equals(const CFObject& other) const override {
        return value == static_cast<const __CFBoolean&>(other).value;
    }
    CFHashCode Hash() const override { return value ? 1 : 0; }
    std::string Description() const override { return value ? "true" : "false"; }

    const bool value;
};

namespace {

// The booleans are constant-initialized (usable from any static initializer) and, inside a
// union whose destructor does nothing, never destroyed (usable from any static destructor).
union BooleanStorage {
    constexpr explicit BooleanStorage(bool value) : object(value) {}
    ~BooleanStorage() {}
    __CFBoolean object;
};
constinit BooleanStorage trueStorage(true);
constinit BooleanStorage falseStorage(false);

const __CFNumber* AsNumber(CFNumberRef number) {
    return glyphwell::runtime::As<__CFNumber>(number, kNumberKind);
}

} // namespace

const CFBooleanRef kCFBooleanTrue = &trueStorage.object;
const CFBooleanRef kCFBooleanFalse = &falseStorage.object;

CFTypeID CFNumberGetTypeID() {
    return kNumberKind;
}
CFTypeID CFBooleanGetTypeID() {
    return kBooleanKind;
}

CFIndex CFNumberTypeByteSize(CFNumberType type) {
    static constexpr CFIndex sizes[kCFNumberMaxType + 1] = {0, 1, 2, 4, 8, 4, 8, 1, 2,
                                                            4, 8, 8, 4, 8, 8, 8, 8};
    return IsValidType(type) ? sizes[type] : 0;
}

/// Reads a value of type T from possibly unaligned memory.
template <class T> static T Load(const void* valuePtr) {
    T value;
    std::memcpy(&value, valuePtr, sizeof value);
    return value;
}

namespace {

/// Shared numbers for the small integers that most messages carry (results, flags, counts), one
/// per integer type and value from kSmallestShared to kLargestShared: made once, in static
/// storage so that making them cannot fail, and never destroyed.
constexpr int64_t kSmallestShared = -1;
constexpr int64_t kLargestShared = 15;
constexpr size_t kSharedPerType = size_t(kLargestShared - kSmallestShared + 1);

class SmallIntegers {
public:
    SmallIntegers() {
        for (CFNumberType type = 1; type <= kCFNumberMaxType; ++type)
            if (!IsFloatType(type))
                for (int64_t value = kSmallestShared; value <= kLargestShared; ++value)
                    new (Slot(type, value)) __CFNumber(type, value, true);
    }
    SmallIntegers(const SmallIntegers&) = delete;
    SmallIntegers& operator=(const SmallIntegers&) = delete;

    const __CFNumber* Find(CFNumberType type, int64_t value) {
        return value >= kSmallestShared && value <= kLargestShared
                   ? std::launder(reinterpret_cast<const __CFNumber*>(Slot(type, value)))
                   : nullptr;
    }

private:
    void* Slot(CFNumberType type, int64_t value) {
        return storage[size_t(type - 1)][size_t(value - kSmallestShared)];
    }

    alignas(__CFNumber) unsigned char storage[kCFNumberMaxType][kSharedPerType][sizeof(__CFNumber)];
};

/// The shared number for `integer` of integer type `type`, or null when it has none.
const __CFNumber* SharedSmallInteger(CFNumberType type, int64_t integer) {
    if (integer < kSmallestShared || integer > kLargestShared)
        return nullptr;
    static SmallIntegers shared;
    return shared.Find(type, integer);
}

} // namespace

namespace {

/// CFNumberCreate and CFNumberCreateCounted after their argument checks: `share` hands out the
/// shared small integers.
CFNumberRef CreateNumber(CFNumberType type, const void* valuePtr, bool share) {
    if (IsFloatType(type)) {
        double real = CFNumberTypeByteSize(type) == 4 ? double(Load<float>(valuePtr))
                                                      : Load<double>(valuePtr);
        return new __CFNumber(type, real);
    }
    int64_t integer = 0;
    switch (CFNumberTypeByteSize(type)) {
    case 1:
        integer = Load<int8_t>(valuePtr);
        break;
    case 2:
        integer = Load<int16_t>(valuePtr);
        break;
    case 4:
        integer = Load<int32_t>(valuePtr);
        break;
    default:
        integer = Load<int64_t>(valuePtr);
        break;
    }
    if (const __CFNumber* shared = share ? SharedSmallInteger(type, integer) : nullptr)
        return shared;
    return new __CFNumber(type, integer);
}

} // namespace

CFNumberRef CFNumberCreate(CFAllocatorRef, CFNumberType type, const void* valuePtr) {
    if (!GW_CHECK_ARGUMENT(IsValidType(type)) || !GW_CHECK_ARGUMENT(valuePtr != nullptr))
        return nullptr;
    return CreateNumber(type, valuePtr, true);
}

CFNumberRef CFNumberCreateCounted(CFAllocatorRef, CFNumberType type, const void* valuePtr) {
    if (!GW_CHECK_ARGUMENT(IsValidType(type)) || !GW_CHECK_ARGUMENT(valuePtr != nullptr))
        return nullptr;
    return CreateNumber(type, valuePtr, false);
}

CFNumberType CFNumberGetType(CFNumberRef number) {
    const __CFNumber* object = AsNumber(number);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? object->type : 0;
}

CFIndex CFNumberGetByteSize(CFNumberRef number) {
    const __CFNumber* object = AsNumber(number);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object ? CFNumberTypeByteSize(object->type) : 0;
}

Boolean CFNumberIsFloatType(CFNumberRef number) {
    const __CFNumber* object = AsNumber(number);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object && object->isFloat;
}

Boolean CFNumberGetValue(CFNumberRef number, CFNumberType type, void* valuePtr) {
    const __CFNumber* object = AsNumber(number);
    GW_CHECK_ARGUMENT(object != nullptr);
    GW_CHECK_ARGUMENT(valuePtr != nullptr);
    if (!object || !valuePtr || !IsValidType(type))
        return false;
    CFIndex size = CFNumberTypeByteSize(type);

    if (IsFloatType(type)) {
        if (size == 4) {
            float result = object->isFloat ? RoundToFloat(object->real)
                                           : float(object->integer); // int64 always fits a float
            std::memcpy(valuePtr, &result, sizeof result);
            if (std::isnan(result))
                return true; // NaN stays NaN
            return object->isFloat ? double(result) == object->real
                                   : CompareIntegerWithDouble(object->integer, result) == 0;
        }
        double result = object->isFloat ? object->real : double(object->integer);
        std::memcpy(valuePtr, &result, sizeof result);
        return object->isFloat || CompareIntegerWithDouble(object->integer, result) == 0;
    }

    if (object->isFloat) {
        switch (size) {
        case 1:
            return StoreFromDouble<int8_t>(object->real, valuePtr);
        case 2:
            return StoreFromDouble<int16_t>(object->real, valuePtr);
        case 4:
            return StoreFromDouble<int32_t>(object->real, valuePtr);
        default:
            return StoreFromDouble<int64_t>(object->real, valuePtr);
        }
    }
    switch (size) {
    case 1:
        return StoreInteger<int8_t>(object->integer, valuePtr);
    case 2:
        return StoreInteger<int16_t>(object->integer, valuePtr);
    case 4:
        return StoreInteger<int32_t>(object->integer, valuePtr);
    default:
        return StoreInteger<int64_t>(object->integer, valuePtr);
    }
}

CFComparisonResult CFNumberCompare(CFNumberRef a, CFNumberRef b, void*) {
    const __CFNumber* left = AsNumber(a);
    const __CFNumber* right = AsNumber(b);
    GW_CHECK_ARGUMENT(left != nullptr && right != nullptr);
    if (!left || !right)
        return kCFCompareEqualTo;
    return CompareNumbers(*left, *right);
}

Boolean CFBooleanGetValue(CFBooleanRef boolean) {
    const __CFBoolean* object = glyphwell::runtime::As<__CFBoolean>(boolean, kBooleanKind);
    GW_CHECK_ARGUMENT(object != nullptr);
    return object && object->value;
}
