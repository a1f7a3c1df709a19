// The inputs of the stream benchmarks: four messages, each held in every form the writers and
// readers under test need, built once before anything is timed.
//
// Each case carries the same logical content three ways: as property values (what
// TCFFlattenContext writes), as plain C++ objects that msgpack-cxx packs (structs of
// std::string, std::vector and std::map whose map keys are the property keys), and as the bytes of
// our stream, of msgpack and of CBOR (what the readers read). Kinds without a counterpart in the
// other formats map as follows: a number of type 7 becomes a small integer, a data value and a
// character set become a byte string (for the set: its uncompressed bitmap representation).
#pragma once

#include <msgpack.hpp>

#include <functional>
#include <string>
#include <vector>

#include "platform/PropertyValues.h"

namespace bench {

struct StreamCase {
    std::string name;          ///< "reply", "download-request", "data-1MiB", "charset-4-planes"
    CFTypeRef value = nullptr; ///< the property value; lives for the process
    CFTypeID kind = 0;         ///< its kind, for picking the reader's Retrieve operation
    /// Packs the C++ objects into `buffer`; the objects live for the process.
    std::function<void(msgpack::sbuffer& buffer)> packMsgpack;

    std::vector<unsigned char> flattened; ///< our stream of `value`
    std::vector<unsigned char> msgpack;   ///< the msgpack bytes of the same content
    std::vector<unsigned char> cbor;      ///< the CBOR bytes of the same content
};

/// The four cases, built on first call.
const std::vector<StreamCase>& StreamCases();

/// The stream of `value` as TCFFlattenContext writes it into a fresh buffer.
std::vector<unsigned char> Flatten(CFTypeRef value);

/// The case named `name`, or null.
const StreamCase* FindStreamCase(const std::string& name);

/// Reads the case's stream once with TCFResurrectContext (Retrieve of the top-level kind) and
/// releases the value.
void ReadOnce(const StreamCase& message);

/// Writes the case's value once with TCFFlattenContext into a new buffer; aborts when the
/// stream differs in length from the case's.
void WriteOnce(const StreamCase& message);

} // namespace bench
