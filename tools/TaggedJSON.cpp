#include "tools/TaggedJSON.h"

#include <cmath>
#include <cstring>
#include <limits>
#include <optional>
#include <vector>

#include "cfutil/TCFRetained.h"
#include "tools/Base64.h"

namespace glyphwell::tools {

using Json = nlohmann::ordered_json;

namespace {

constexpr size_t kMaxStreamedLength = 0x100000;

/// A failure while reading tagged JSON, with the JSON pointer of the value at fault.
struct InputError {
    std::string where;
    std::string what;
};

/// The values made while a container is read, each holding its own count, so that an error
/// thrown part way releases them.
using Values = std::vector<TCFRetained<CFTypeRef>>;

/// Adopts `value` (a new reference) into `values` and returns it.
CFTypeRef Keep(Values& values, CFTypeRef value) {
    values.emplace_back(value, kAdopted);
    return value;
}

/// The bare references of `values`, for the Create calls that take a C array.
std::vector<const void*> Pointers(const Values& values) {
    return std::vector<const void*>(values.begin(), values.end());
}

/// The JSON pointer of member `step` below `where` ("~" and "/" escaped).
std::string Child(const std::string& where, const std::string& step) {
    std::string escaped;
    for (char c : step) {
        if (c == '~')
            escaped += "~0";
        else if (c == '/')
            escaped += "~1";
        else
            escaped += c;
    }
    return (where == "/" ? "" : where) + "/" + escaped;
}

/// The JSON pointer of element `index` below `where`.
std::string Child(const std::string& where, size_t index) {
    return Child(where, std::to_string(index));
}

/// The property value of `json` at `where`; throws InputError.
CFTypeRef Create(const Json& json, const std::string& where);

/// NaN and the infinities, which JSON writes as strings.
std::optional<double> SpecialFloat(const Json& value) {
    if (!value.is_string())
        return std::nullopt;
    const std::string& text = value.get_ref<const std::string&>();
    if (text == "NaN")
        return std::numeric_limits<double>::quiet_NaN();
    if (text == "Infinity")
        return std::numeric_limits<double>::infinity();
    if (text == "-Infinity")
        return -std::numeric_limits<double>::infinity();
    return std::nullopt;
}

/// {"$number": V, "$type": CODE}: checks the code and that V fits it.
CFTypeRef CreateNumber(const Json& tagged, const std::string& where) {
    if (tagged.size() != 2 || !tagged.contains("$type"))
        throw InputError{where, "a \"$number\" needs exactly the keys \"$number\" and \"$type\""};
    const Json& code = tagged["$type"];
    const Json& value = tagged["$number"];
    if (!code.is_number_integer() || code.get<int64_t>() < 1 || code.get<int64_t>() > 16)
        throw InputError{Child(where, "$type"), "number type code must be an integer from 1 to 16"};
    const CFNumberType type = code.get<int64_t>();
    const bool isFloat = type == kCFNumberFloat32Type || type == kCFNumberFloat64Type ||
                         type == kCFNumberFloatType || type == kCFNumberDoubleType ||
                         type == kCFNumberCGFloatType;
    // JSON has no NaN or infinities: floating-point codes take them as strings.
    const std::optional<double> special = isFloat ? SpecialFloat(value) : std::nullopt;
    if (!value.is_number() && !special)
        throw InputError{Child(where, "$number"),
                         isFloat ? "\"$number\" must be a JSON number, \"NaN\", \"Infinity\" or "
                                   "\"-Infinity\""
                                 : "\"$number\" must be a JSON number"};
    if (isFloat) {
        const double d = special ? *special : value.get<double>();
        if (CFNumberTypeByteSize(type) == 4) {
            const float f = static_cast<float>(d);
            if (std::isfinite(d) && !std::isfinite(f))
                throw InputError{Child(where, "$number"), "value out of range for a 4-byte float"};
            return CFNumberCreate(kCFAllocatorDefault, type, &f);
        }
        return CFNumberCreate(kCFAllocatorDefault, type, &d);
    }
    if (!value.is_number_integer())
        throw InputError{Child(where, "$number"),
                         "type " + std::to_string(type) + " needs an integer value"};
    if (value.is_number_unsigned() && value.get<uint64_t>() > uint64_t(INT64_MAX))
        throw InputError{Child(where, "$number"), "integer out of range"};
    const int64_t v = value.get<int64_t>();
    const int bits = int(CFNumberTypeByteSize(type)) * 8;
    if (bits < 64 && (v < -(int64_t(1) << (bits - 1)) || v >= (int64_t(1) << (bits - 1))))
        throw InputError{Child(where, "$number"),
                         "value out of range for type " + std::to_string(type)};
    // Every integer code reads a little-endian value of its width, so the low bytes of v serve.
    return CFNumberCreate(kCFAllocatorDefault, type, &v);
}

/// {"$uuid": "8-4-4-4-12"}.
CFTypeRef CreateUUID(const Json& text, const std::string& where) {
    static const char kShape[] = "xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx";
    const std::string s = text.is_string() ? text.get<std::string>() : std::string();
    bool ok = text.is_string() && s.size() == sizeof kShape - 1;
    for (size_t i = 0; ok && i < s.size(); ++i)
        ok = kShape[i] == '-' ? s[i] == '-' : std::isxdigit(static_cast<unsigned char>(s[i]));
    if (!ok)
        throw InputError{where, "\"$uuid\" must be a string of the form " + std::string(kShape)};
    UInt8 bytes[16];
    for (size_t i = 0, k = 0; k < 16; ++k) {
        if (s[i] == '-')
            ++i;
        bytes[k] = UInt8(std::stoi(s.substr(i, 2), nullptr, 16));
        i += 2;
    }
    CFUUIDBytes uuid;
    std::memcpy(&uuid, bytes, 16);
    return CFUUIDCreateFromUUIDBytes(kCFAllocatorDefault, uuid);
}

/// {"$charset": [[first, last], ...]}.
CFTypeRef CreateCharacterSet(const Json& ranges, const std::string& where) {
    if (!ranges.is_array())
        throw InputError{where, "\"$charset\" must be an array of [first, last] ranges"};
    TCFAdopted<CFMutableCharacterSetRef> set(CFCharacterSetCreateMutable(kCFAllocatorDefault));
    for (size_t i = 0; i < ranges.size(); ++i) {
        const Json& range = ranges[i];
        auto isCodePoint = [](const Json& j) {
            return j.is_number_integer() && j.get<int64_t>() >= 0 && j.get<int64_t>() <= 0x10FFFF;
        };
        if (!range.is_array() || range.size() != 2 || !isCodePoint(range[0]) ||
            !isCodePoint(range[1]) || range[0].get<int64_t>() > range[1].get<int64_t>())
            throw InputError{Child(where, i),
                             "a range is [first, last] with 0 <= first <= last <= 1114111"};
        const CFIndex first = range[0].get<int64_t>();
        CFCharacterSetAddCharactersInRange(set,
                                           CFRangeMake(first, range[1].get<int64_t>() - first + 1));
    }
    return CFCharacterSetCreateCopy(kCFAllocatorDefault, set);
}

/// A plain or "$array" array, or a "$set".
CFTypeRef CreateArrayOrSet(const Json& items, const std::string& where, bool isSet) {
    if (!items.is_array())
        throw InputError{where,
                         isSet ? "\"$set\" must be an array" : "\"$array\" must be an array"};
    Values elements;
    for (size_t i = 0; i < items.size(); ++i)
        Keep(elements, Create(items[i], Child(where, i)));
    std::vector<const void*> pointers = Pointers(elements);
    if (isSet)
        return CFSetCreate(kCFAllocatorDefault, pointers.data(), CFIndex(pointers.size()),
                           &kCFTypeSetCallBacks);
    return CFArrayCreate(kCFAllocatorDefault, pointers.data(), CFIndex(pointers.size()),
                         &kCFTypeArrayCallBacks);
}

/// A new dictionary of the parallel `keys` and `values`, retaining both.
CFTypeRef CreateDictionary(const Values& keys, const Values& values) {
    std::vector<const void*> keyPointers = Pointers(keys), valuePointers = Pointers(values);
    return CFDictionaryCreate(kCFAllocatorDefault, keyPointers.data(), valuePointers.data(),
                              CFIndex(keyPointers.size()), &kCFTypeDictionaryKeyCallBacks,
                              &kCFTypeDictionaryValueCallBacks);
}

/// {"$dict": [[key, value], ...]}, keys of any kind.
CFTypeRef CreateDictionaryFromPairs(const Json& pairs, const std::string& where) {
    if (!pairs.is_array())
        throw InputError{where, "\"$dict\" must be an array of [key, value] pairs"};
    Values keys, values;
    for (size_t i = 0; i < pairs.size(); ++i) {
        const std::string at = Child(where, i);
        if (!pairs[i].is_array() || pairs[i].size() != 2)
            throw InputError{at, "a \"$dict\" entry is a [key, value] pair"};
        Keep(keys, Create(pairs[i][0], Child(at, 0)));
        Keep(values, Create(pairs[i][1], Child(at, 1)));
    }
    return CreateDictionary(keys, values);
}

/// {"$error": {"domain": S, "code": N}}.
CFTypeRef CreateError(const Json& error, const std::string& where) {
    if (!error.is_object() || error.size() != 2 || !error.contains("domain") ||
        !error.contains("code") || !error["domain"].is_string() ||
        !error["code"].is_number_integer())
        throw InputError{where, "\"$error\" must be {\"domain\": string, \"code\": integer}"};
    if (error["code"].is_number_unsigned() && error["code"].get<uint64_t>() > uint64_t(INT64_MAX))
        throw InputError{Child(where, "code"), "integer out of range"};
    TCFAdopted<CFStringRef> domain(glyphwell::CreateString(error["domain"].get<std::string>()));
    if (!domain)
        throw InputError{Child(where, "domain"), "not valid UTF-8"};
    return CFErrorCreate(kCFAllocatorDefault, domain, error["code"].get<int64_t>(), nullptr);
}

/// A tagged object, by its tag.
CFTypeRef CreateTagged(const Json& object, const std::string& where) {
    const std::string tag = object.begin().key();
    const Json& body = object.begin().value();
    if (tag == "$number" || (tag == "$type" && object.contains("$number")))
        return CreateNumber(object, where);
    if (object.size() != 1)
        throw InputError{where, "a tagged object has exactly one key (found " +
                                    std::to_string(object.size()) + ")"};
    const std::string at = Child(where, tag);
    if (tag == "$data") {
        std::optional<std::vector<uint8_t>> bytes;
        if (body.is_string())
            bytes = DecodeBase64(body.get<std::string>());
        if (!bytes)
            throw InputError{at, "\"$data\" must be a base64 string"};
        return CFDataCreate(kCFAllocatorDefault, bytes->data(), CFIndex(bytes->size()));
    }
    if (tag == "$url") {
        if (!body.is_string())
            throw InputError{at, "\"$url\" must be a string"};
        const std::string text = body.get<std::string>();
        if (text.size() > kMaxStreamedLength)
            throw InputError{at, "URL longer than 1048576 bytes cannot be written"};
        CFURLRef url =
            CFURLCreateWithBytes(kCFAllocatorDefault, reinterpret_cast<const UInt8*>(text.data()),
                                 CFIndex(text.size()), kCFStringEncodingUTF8, nullptr);
        if (!url)
            throw InputError{at, "not a URL: " + text};
        return url;
    }
    if (tag == "$uuid")
        return CreateUUID(body, at);
    if (tag == "$set")
        return CreateArrayOrSet(body, at, true);
    if (tag == "$array")
        return CreateArrayOrSet(body, at, false);
    if (tag == "$dict")
        return CreateDictionaryFromPairs(body, at);
    if (tag == "$error")
        return CreateError(body, at);
    if (tag == "$charset")
        return CreateCharacterSet(body, at);
    throw InputError{where, "unknown tag \"" + tag + "\""};
}

/// True when a key of `object` starts with "$".
bool IsTagged(const Json& object) {
    for (auto it = object.begin(); it != object.end(); ++it)
        if (!it.key().empty() && it.key()[0] == '$')
            return true;
    return false;
}

CFTypeRef Create(const Json& json, const std::string& where) {
    switch (json.type()) {
    case Json::value_t::null:
        throw InputError{where, "null has no property value"};
    case Json::value_t::boolean:
        return CFRetain(json.get<bool>() ? kCFBooleanTrue : kCFBooleanFalse);
    case Json::value_t::string: {
        TCFAdopted<CFStringRef> string(glyphwell::CreateString(json.get_ref<const std::string&>()));
        if (!string)
            throw InputError{where, "string is not valid UTF-8"};
        // The stream carries texts up to this many UTF-8 bytes (and so UTF-16 units); the writer
        // would write a longer one as empty.
        if (json.get_ref<const std::string&>().size() > kMaxStreamedLength)
            throw InputError{where, "string longer than 1048576 UTF-8 bytes cannot be written"};
        return string.Orphan();
    }
    case Json::value_t::number_integer:
    case Json::value_t::number_unsigned: {
        if (json.is_number_unsigned() && json.get<uint64_t>() > uint64_t(INT64_MAX))
            throw InputError{where, "integer out of range"};
        const int64_t v = json.get<int64_t>();
        return CFNumberCreate(kCFAllocatorDefault, kCFNumberLongType, &v);
    }
    case Json::value_t::number_float: {
        const double d = json.get<double>();
        return CFNumberCreate(kCFAllocatorDefault, kCFNumberDoubleType, &d);
    }
    case Json::value_t::array:
        return CreateArrayOrSet(json, where, false);
    case Json::value_t::object: {
        if (!json.empty() && IsTagged(json))
            return CreateTagged(json, where);
        Values keys, values;
        for (auto it = json.begin(); it != json.end(); ++it) {
            Keep(keys, Create(Json(it.key()), Child(where, it.key())));
            Keep(values, Create(it.value(), Child(where, it.key())));
        }
        return CreateDictionary(keys, values);
    }
    default:
        throw InputError{where, "binary JSON values are not supported"};
    }
}

/// The UTF-8 form of `string`, with '?' for each lone surrogate (which has no UTF-8 form).
std::string StringToUTF8(CFStringRef string) {
    return glyphwell::UTF8String(string, '?').value_or("");
}

/// Types 10 and 13 plain, others tagged with their code.
Json NumberToJSON(CFNumberRef number) {
    const CFNumberType type = CFNumberGetType(number);
    if (CFNumberIsFloatType(number)) {
        double d = 0;
        CFNumberGetValue(number, kCFNumberFloat64Type, &d);
        if (!std::isfinite(d)) {
            const char* text = std::isnan(d) ? "NaN" : d > 0 ? "Infinity" : "-Infinity";
            return Json{{"$number", text}, {"$type", type}};
        }
        if (type == kCFNumberDoubleType)
            return d;
        return Json{{"$number", d}, {"$type", type}};
    }
    int64_t v = 0;
    CFNumberGetValue(number, kCFNumberSInt64Type, &v);
    if (type == kCFNumberLongType)
        return v;
    return Json{{"$number", v}, {"$type", type}};
}

/// The code point ranges of `set`, plane by plane.
Json CharacterSetToJSON(CFCharacterSetRef set) {
    Json ranges = Json::array();
    TCFAdopted<CFDataRef> bitmap(
        CFCharacterSetCreateBitmapRepresentation(kCFAllocatorDefault, set));
    if (!bitmap)
        return Json{{"$charset", ranges}};
    const UInt8* bytes = CFDataGetBytePtr(bitmap);
    const CFIndex length = CFDataGetLength(bitmap);
    // Walk the planes in the representation's order (BMP, then increasing plane numbers).
    long open = -1;
    auto visit = [&](long plane, const UInt8* bits) {
        for (long c = 0; c < 0x10000; ++c) {
            const long codePoint = plane * 0x10000 + c;
            const bool member = bits[c >> 3] & (1 << (c & 7));
            if (member && open < 0)
                open = codePoint;
            else if (!member && open >= 0) {
                ranges.push_back(Json::array({open, codePoint - 1}));
                open = -1;
            }
        }
    };
    long lastPlane = 0;
    visit(0, bytes);
    for (CFIndex offset = 8192; offset + 8193 <= length; offset += 8193) {
        const long plane = bytes[offset];
        if (open >= 0 && plane != lastPlane + 1) {
            ranges.push_back(Json::array({open, lastPlane * 0x10000 + 0xFFFF}));
            open = -1;
        }
        visit(plane, bytes + offset + 1);
        lastPlane = plane;
    }
    if (open >= 0)
        ranges.push_back(Json::array({open, lastPlane * 0x10000 + 0xFFFF}));
    return Json{{"$charset", ranges}};
}

struct PairCollector {
    std::vector<std::pair<CFTypeRef, CFTypeRef>> pairs;
    bool plainKeys = true;
};

/// Applier: gathers a dictionary's pairs and whether all keys are plain.
void CollectPair(const void* key, const void* value, void* context) {
    auto* collector = static_cast<PairCollector*>(context);
    collector->pairs.emplace_back(key, value);
    if (!key || CFGetTypeID(key) != CFStringGetTypeID() ||
        (CFStringGetLength(static_cast<CFStringRef>(key)) > 0 &&
         CFStringGetCharacterAtIndex(static_cast<CFStringRef>(key), 0) == u'$'))
        collector->plainKeys = false;
}

/// Applier: gathers a set's members.
void CollectValue(const void* value, void* context) {
    static_cast<std::vector<CFTypeRef>*>(context)->push_back(value);
}

/// A dictionary as a plain object when every key is a string without a leading "$", else in the
/// "$dict" form.
Json DictionaryToJSON(CFDictionaryRef dictionary) {
    PairCollector collector;
    CFDictionaryApplyFunction(dictionary, CollectPair, &collector);
    if (collector.plainKeys) {
        Json object = Json::object();
        for (const auto& [key, item] : collector.pairs)
            object[StringToUTF8(static_cast<CFStringRef>(key))] = ValueToJSON(item);
        return object;
    }
    Json pairs = Json::array();
    for (const auto& [key, item] : collector.pairs)
        pairs.push_back(Json::array({ValueToJSON(key), ValueToJSON(item)}));
    return Json{{"$dict", pairs}};
}

} // namespace

CFTypeRef CreateValueFromJSON(const Json& json, std::string* error) {
    try {
        return Create(json, "/");
    } catch (const InputError& failure) {
        if (error)
            *error = "at " + failure.where + ": " + failure.what;
        return nullptr;
    }
}

Json ValueToJSON(CFTypeRef value) {
    if (!value)
        return nullptr;
    const CFTypeID kind = CFGetTypeID(value);
    if (kind == CFStringGetTypeID())
        return StringToUTF8(static_cast<CFStringRef>(value));
    if (kind == CFBooleanGetTypeID())
        return bool(CFBooleanGetValue(static_cast<CFBooleanRef>(value)));
    if (kind == CFNumberGetTypeID())
        return NumberToJSON(static_cast<CFNumberRef>(value));
    if (kind == CFDataGetTypeID()) {
        CFDataRef data = static_cast<CFDataRef>(value);
        return Json{{"$data", EncodeBase64(CFDataGetBytePtr(data), size_t(CFDataGetLength(data)))}};
    }
    if (kind == CFArrayGetTypeID()) {
        Json items = Json::array();
        CFArrayRef array = static_cast<CFArrayRef>(value);
        for (CFIndex i = 0, n = CFArrayGetCount(array); i < n; ++i)
            items.push_back(ValueToJSON(CFArrayGetValueAtIndex(array, i)));
        return items;
    }
    if (kind == CFSetGetTypeID()) {
        std::vector<CFTypeRef> members;
        CFSetApplyFunction(static_cast<CFSetRef>(value), CollectValue, &members);
        Json items = Json::array();
        for (CFTypeRef member : members)
            items.push_back(ValueToJSON(member));
        return Json{{"$set", items}};
    }
    if (kind == CFDictionaryGetTypeID())
        return DictionaryToJSON(static_cast<CFDictionaryRef>(value));
    if (kind == CFURLGetTypeID())
        return Json{{"$url", StringToUTF8(CFURLGetString(static_cast<CFURLRef>(value)))}};
    if (kind == CFUUIDGetTypeID()) {
        TCFAdopted<CFStringRef> text(
            CFUUIDCreateString(kCFAllocatorDefault, static_cast<CFUUIDRef>(value)));
        std::string lower = StringToUTF8(text);
        for (char& c : lower)
            c = char(std::tolower(static_cast<unsigned char>(c)));
        return Json{{"$uuid", lower}};
    }
    if (kind == CFErrorGetTypeID()) {
        CFErrorRef error = static_cast<CFErrorRef>(const_cast<void*>(value));
        return Json{{"$error",
                     {{"domain", StringToUTF8(CFErrorGetDomain(error))},
                      {"code", int64_t(CFErrorGetCode(error))}}}};
    }
    if (kind == CFCharacterSetGetTypeID())
        return CharacterSetToJSON(static_cast<CFCharacterSetRef>(value));
    return Json{{"$unsupported", Describe(value)}};
}

} // namespace glyphwell::tools
