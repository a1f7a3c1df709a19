// The type ids of the flattened value stream. They are fixed numbers of the byte format, not the
// run-time kinds of the property values (CFGetTypeID), which the writer and reader map onto them.
#pragma once

#include <cstdint>

enum TCFType : uint32_t {
    kTCFTypeString = 7,
    kTCFTypeDictionary = 16,
    kTCFTypeArray = 17,
    kTCFTypeData = 18,
    kTCFTypeNumber = 22,
    kTCFTypeCharacterSet = 27,
    kTCFTypeSet = 256,
    kTCFTypeURL = 257,
    kTCFTypeUUID = 258,
    kTCFTypeBoolean = 259,
    kTCFTypeError = 260,
    /// Never written: the reader's "any type" argument and its marker for an unreadable type id.
    kTCFTypeAny = 99999,
};

/// The longest text (in UTF-16 units and in UTF-8 bytes) and URL (in bytes) the stream carries.
inline constexpr long kTCFMaxStringLength = 0x100000;
/// The largest element or pair count the reader accepts for a container.
inline constexpr long kTCFMaxContainerCount = 0xA00000;
