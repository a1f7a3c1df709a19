#include "BenchContent.h"

#include <cbor.h>

#include <cstdio>
#include <cstdlib>
#include <map>
#include <utility>

#include "serialization/TCFFlattenContext.h"
#include "serialization/TCFResurrectContext.h"
#include "support/FlattenedBytes.h"

namespace bench {
namespace {

// ---------------------------------------------------------------------------------------------
// The C++ objects that msgpack packs: map keys are the property keys.

struct ReplyMessage {
    signed char result = 1;
    signed char suppress = 0;
    MSGPACK_DEFINE_MAP(MSGPACK_NVP("QZUIPropertyResult", result),
                       MSGPACK_NVP("QZUIPropertySuppress", suppress));
};

struct FontProperties {
    std::string name;
    std::string family;
    std::map<std::string, std::string> localizedFamily;
    MSGPACK_DEFINE_MAP(MSGPACK_NVP("NSFontNameAttribute", name),
                       MSGPACK_NVP("NSFontFamilyAttribute", family),
                       MSGPACK_NVP("NSCTFontLocalizedFamilyNameAttribute", localizedFamily));
};

struct DownloadRequest {
    std::string applicationName;
    int32_t processID = 0;
    std::vector<FontProperties> fonts;
    bool suppress = false;
    MSGPACK_DEFINE_MAP(MSGPACK_NVP("QZUIPropertyApplicationName", applicationName),
                       MSGPACK_NVP("QZUIPropertyProcessID", processID),
                       MSGPACK_NVP("QZUIPropertyFontProperties", fonts),
                       MSGPACK_NVP("QZUIPropertySuppress", suppress));
};

constexpr int kFontCount = 50;
constexpr size_t kDataLength = 1 << 20;

DownloadRequest MakeDownloadRequest() {
    DownloadRequest request;
    request.applicationName = "Glyphwell Writer";
    request.processID = 48213;
    for (int i = 0; i < kFontCount; ++i) {
        char digits[16];
        std::snprintf(digits, sizeof digits, "%02d", i);
        const std::string nn = digits;
        FontProperties font;
        font.name = "Family" + nn + "-Regular";
        font.family = "Family " + nn;
        font.localizedFamily = {{"de", "Schriftfamilie " + nn},
                                {"fr", "Famille de polices " + nn},
                                {"ja", "書体ファミリー " + nn + " 明朝"},
                                {"zh-Hans", "字体家族 " + nn + " 宋体"}};
        request.fonts.push_back(std::move(font));
    }
    return request;
}

std::vector<char> MakeDataBytes() {
    std::vector<char> bytes(kDataLength);
    uint32_t state = 0x12345678u;
    for (char& byte : bytes) {
        state = state * 1664525u + 1013904223u;
        byte = static_cast<char>(state >> 24);
    }
    return bytes;
}

/// BMP + planes 1, 2 and 14, as a large CJK font with emoji and math covers them.
CFCharacterSetRef MakeCharacterSet() {
    static const std::pair<UTF32Char, UTF32Char> kRanges[] = {
        {0x20, 0x7E},       {0xA0, 0x24F},      {0x370, 0x3FF},     {0x400, 0x4FF},
        {0x2000, 0x206F},   {0x3000, 0x303F},   {0x3040, 0x30FF},   {0x4E00, 0x9FFF},
        {0xAC00, 0xD7A3},   {0xFF00, 0xFFEF},   {0x1D400, 0x1D7FF}, {0x1F300, 0x1F5FF},
        {0x1F600, 0x1F64F}, {0x1F900, 0x1F9FF}, {0x20000, 0x2A6DF}, {0x2F800, 0x2FA1F},
        {0xE0001, 0xE0001}, {0xE0020, 0xE007F}, {0xE0100, 0xE01EF},
    };
    CFMutableCharacterSetRef set = CFCharacterSetCreateMutable(nullptr);
    for (const auto& [first, last] : kRanges)
        CFCharacterSetAddCharactersInRange(set, CFRangeMake(first, last - first + 1));
    return set;
}

// ---------------------------------------------------------------------------------------------
// Property values.

CFStringRef MakeString(const std::string& text) {
    return CFStringCreateWithBytes(nullptr, reinterpret_cast<const UInt8*>(text.data()),
                                   static_cast<CFIndex>(text.size()), kCFStringEncodingUTF8, false);
}

/// A dictionary of the pairs, each key and value adopted (released once it is in).
CFDictionaryRef MakeDictionary(const std::vector<std::pair<CFTypeRef, CFTypeRef>>& pairs) {
    std::vector<const void*> keys, values;
    for (const auto& [key, value] : pairs) {
        keys.push_back(key);
        values.push_back(value);
    }
    CFDictionaryRef dictionary =
        CFDictionaryCreate(nullptr, keys.data(), values.data(), static_cast<CFIndex>(keys.size()),
                           &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    for (const auto& [key, value] : pairs) {
        CFRelease(key);
        CFRelease(value);
    }
    return dictionary;
}

CFNumberRef MakeNumber(CFNumberType type, const void* value) {
    return CFNumberCreate(nullptr, type, value);
}

CFDictionaryRef ReplyValue(const ReplyMessage& reply) {
    return MakeDictionary(
        {{MakeString("QZUIPropertyResult"), MakeNumber(kCFNumberCharType, &reply.result)},
         {MakeString("QZUIPropertySuppress"), MakeNumber(kCFNumberCharType, &reply.suppress)}});
}

CFDictionaryRef RequestValue(const DownloadRequest& request) {
    std::vector<const void*> fonts;
    for (const FontProperties& font : request.fonts) {
        std::vector<std::pair<CFTypeRef, CFTypeRef>> localized;
        for (const auto& [language, name] : font.localizedFamily)
            localized.emplace_back(MakeString(language), MakeString(name));
        fonts.push_back(MakeDictionary(
            {{MakeString("NSFontNameAttribute"), MakeString(font.name)},
             {MakeString("NSFontFamilyAttribute"), MakeString(font.family)},
             {MakeString("NSCTFontLocalizedFamilyNameAttribute"), MakeDictionary(localized)}}));
    }
    CFArrayRef array = CFArrayCreate(nullptr, fonts.data(), static_cast<CFIndex>(fonts.size()),
                                     &kCFTypeArrayCallBacks);
    for (const void* font : fonts)
        CFRelease(font);
    return MakeDictionary(
        {{MakeString("QZUIPropertyApplicationName"), MakeString(request.applicationName)},
         {MakeString("QZUIPropertyProcessID"), MakeNumber(kCFNumberSInt32Type, &request.processID)},
         {MakeString("QZUIPropertyFontProperties"), array},
         {MakeString("QZUIPropertySuppress"),
          request.suppress ? kCFBooleanTrue : kCFBooleanFalse}});
}

// ---------------------------------------------------------------------------------------------
// CBOR.

cbor_item_t* CborString(const std::string& text) {
    return cbor_build_stringn(text.data(), text.size());
}

cbor_item_t* CborBytes(const std::vector<char>& bytes) {
    return cbor_build_bytestring(reinterpret_cast<cbor_data>(bytes.data()), bytes.size());
}

/// Adds a pair to `map`, handing both items over.
void CborAdd(cbor_item_t* map, cbor_item_t* key, cbor_item_t* value) {
    cbor_map_add(map, cbor_pair{cbor_move(key), cbor_move(value)});
}

cbor_item_t* ReplyCbor(const ReplyMessage& reply) {
    cbor_item_t* map = cbor_new_definite_map(2);
    CborAdd(map, CborString("QZUIPropertyResult"), cbor_build_uint8(uint8_t(reply.result)));
    CborAdd(map, CborString("QZUIPropertySuppress"), cbor_build_uint8(uint8_t(reply.suppress)));
    return map;
}

cbor_item_t* RequestCbor(const DownloadRequest& request) {
    cbor_item_t* fonts = cbor_new_definite_array(request.fonts.size());
    for (const FontProperties& font : request.fonts) {
        cbor_item_t* localized = cbor_new_definite_map(font.localizedFamily.size());
        for (const auto& [language, name] : font.localizedFamily)
            CborAdd(localized, CborString(language), CborString(name));
        cbor_item_t* item = cbor_new_definite_map(3);
        CborAdd(item, CborString("NSFontNameAttribute"), CborString(font.name));
        CborAdd(item, CborString("NSFontFamilyAttribute"), CborString(font.family));
        CborAdd(item, CborString("NSCTFontLocalizedFamilyNameAttribute"), localized);
        cbor_array_push(fonts, cbor_move(item));
    }
    cbor_item_t* map = cbor_new_definite_map(4);
    CborAdd(map, CborString("QZUIPropertyApplicationName"), CborString(request.applicationName));
    CborAdd(map, CborString("QZUIPropertyProcessID"),
            cbor_build_uint32(uint32_t(request.processID)));
    CborAdd(map, CborString("QZUIPropertyFontProperties"), fonts);
    CborAdd(map, CborString("QZUIPropertySuppress"), cbor_build_bool(request.suppress));
    return map;
}

/// The encoded bytes of `item`, which is released.
std::vector<unsigned char> CborSerialize(cbor_item_t* item) {
    unsigned char* buffer = nullptr;
    size_t capacity = 0;
    const size_t length = cbor_serialize_alloc(item, &buffer, &capacity);
    std::vector<unsigned char> bytes(buffer, buffer + length);
    std::free(buffer);
    cbor_decref(&item);
    return bytes;
}

template <class T> std::function<void(msgpack::sbuffer&)> Packer(const T& object) {
    return [&object](msgpack::sbuffer& buffer) { msgpack::pack(buffer, object); };
}

std::vector<unsigned char> Packed(const std::function<void(msgpack::sbuffer&)>& pack) {
    msgpack::sbuffer buffer;
    pack(buffer);
    return std::vector<unsigned char>(buffer.data(), buffer.data() + buffer.size());
}

std::vector<StreamCase> MakeStreamCases() {
    // The C++ objects live for the process, like the property values.
    static const ReplyMessage reply;
    static const DownloadRequest request = MakeDownloadRequest();
    static const std::vector<char> data = MakeDataBytes();
    static CFCharacterSetRef set = MakeCharacterSet();
    static const std::vector<char> bitmap = [] {
        CFDataRef representation = CFCharacterSetCreateBitmapRepresentation(nullptr, set);
        const char* bytes = reinterpret_cast<const char*>(CFDataGetBytePtr(representation));
        std::vector<char> copy(bytes, bytes + CFDataGetLength(representation));
        CFRelease(representation);
        return copy;
    }();

    std::vector<StreamCase> cases(4);
    cases[0].name = "reply";
    cases[0].value = ReplyValue(reply);
    cases[0].packMsgpack = Packer(reply);
    cases[0].cbor = CborSerialize(ReplyCbor(reply));

    cases[1].name = "download-request";
    cases[1].value = RequestValue(request);
    cases[1].packMsgpack = Packer(request);
    cases[1].cbor = CborSerialize(RequestCbor(request));

    cases[2].name = "data-1MiB";
    cases[2].value = CFDataCreate(nullptr, reinterpret_cast<const UInt8*>(data.data()),
                                  static_cast<CFIndex>(data.size()));
    cases[2].packMsgpack = Packer(data);
    cases[2].cbor = CborSerialize(CborBytes(data));

    cases[3].name = "charset-4-planes";
    cases[3].value = set;
    cases[3].packMsgpack = Packer(bitmap);
    cases[3].cbor = CborSerialize(CborBytes(bitmap));

    for (StreamCase& streamCase : cases) {
        streamCase.kind = CFGetTypeID(streamCase.value);
        streamCase.flattened = Flatten(streamCase.value);
        streamCase.msgpack = Packed(streamCase.packMsgpack);
    }
    return cases;
}

} // namespace

std::vector<unsigned char> Flatten(CFTypeRef value) {
    return glyphwell::testing::FlattenedBytes(value);
}

const std::vector<StreamCase>& StreamCases() {
    static const std::vector<StreamCase> cases = MakeStreamCases();
    return cases;
}

const StreamCase* FindStreamCase(const std::string& name) {
    for (const StreamCase& candidate : StreamCases())
        if (candidate.name == name)
            return &candidate;
    return nullptr;
}

void ReadOnce(const StreamCase& message) {
    TCFResurrectContext context(message.flattened.data(), message.flattened.size());
    CFTypeRef value = message.kind == CFDictionaryGetTypeID() ? context.RetrieveCFDictionary()
                                                              : context.Resurrect(kTCFTypeAny);
    if (value)
        CFRelease(value);
}

void WriteOnce(const StreamCase& message) {
    CFMutableDataRef data = CFDataCreateMutable(nullptr, 0);
    {
        TCFFlattenContext context(data, false);
        context.Flatten(message.value);
    }
    if (CFDataGetLength(data) != CFIndex(message.flattened.size()))
        std::abort();
    CFRelease(data);
}

} // namespace bench
