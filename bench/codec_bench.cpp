// The bitmap representation codec on real character-set bitmaps, beside zlib (compress2 at levels
// 1 and 6, uncompress) on the same bytes in the same run.
//
// Inputs: the coverage of the fonts fontconfig finds on this machine (the font with the most
// characters, as its BMP bitmap alone and as its whole representation; the font with the
// fewest; the union of all fonts), plus an empty and a full BMP bitmap. Without fonts the font
// cases are reported as skipped and the synthetic ones still run.
//
// Bytes per second count uncompressed bytes, for compression and decompression alike; the
// counter compressed_bytes is the size each coder produces.
#include <benchmark/benchmark.h>
#include <fontconfig/fontconfig.h>
#include <zlib.h>

#include <array>
#include <cstring>
#include <string>
#include <vector>

#include "bitmap/QZBitmapRepresentation.h"

namespace {

constexpr size_t kPlaneBytes = 8192;
constexpr int kPlaneCount = 17;

struct Input {
    std::string name;
    std::vector<UInt8> bytes;  ///< the bitmap representation; empty when there is none
    std::string missingReason; ///< why there is none
};

/// The bitmap representation of `charset`: the BMP's 8192 bytes, then a plane number and 8192
/// bytes for each further plane with members. Code point c is bit (c & 7) of byte (c >> 3).
std::vector<UInt8> BitmapRepresentation(const FcCharSet* charset) {
    std::vector<std::array<UInt8, kPlaneBytes>> planes(kPlaneCount);
    std::vector<bool> used(kPlaneCount, false);
    for (auto& plane : planes)
        plane.fill(0);
    FcChar32 map[FC_CHARSET_MAP_SIZE];
    FcChar32 next;
    for (FcChar32 base = FcCharSetFirstPage(charset, map, &next); base != FC_CHARSET_DONE;
         base = FcCharSetNextPage(charset, map, &next)) {
        const FcChar32 plane = base >> 16;
        if (plane >= FcChar32(kPlaneCount))
            break;
        // A page is 256 code points, map[i] bit j being base + 32 i + j.
        UInt8* bytes = planes[plane].data() + ((base & 0xFFFF) >> 3);
        for (int i = 0; i < FC_CHARSET_MAP_SIZE; ++i) {
            for (int k = 0; k < 4; ++k)
                bytes[4 * i + k] |= UInt8(map[i] >> (8 * k));
            used[plane] = used[plane] || map[i] != 0;
        }
    }
    std::vector<UInt8> representation(planes[0].begin(), planes[0].end());
    for (int plane = 1; plane < kPlaneCount; ++plane) {
        if (!used[plane])
            continue;
        representation.push_back(UInt8(plane));
        representation.insert(representation.end(), planes[plane].begin(), planes[plane].end());
    }
    return representation;
}

std::string Label(FcPattern* font) {
    FcChar8* family = nullptr;
    FcChar8* style = nullptr;
    std::string label = "unnamed";
    if (FcPatternGetString(font, FC_FAMILY, 0, &family) == FcResultMatch)
        label = reinterpret_cast<const char*>(family);
    if (FcPatternGetString(font, FC_STYLE, 0, &style) == FcResultMatch)
        label += std::string("-") + reinterpret_cast<const char*>(style);
    for (char& c : label)
        if (c == ' ')
            c = '_';
    return label;
}

/// The real-font inputs, or inputs that say why there are none.
std::vector<Input> FontInputs() {
    std::vector<Input> inputs;
    FcConfig* config = FcInitLoadConfigAndFonts();
    FcPattern* pattern = FcPatternCreate();
    FcObjectSet* objects = FcObjectSetBuild(FC_FAMILY, FC_STYLE, FC_CHARSET, nullptr);
    FcFontSet* fonts = config ? FcFontList(config, pattern, objects) : nullptr;

    FcPattern* largest = nullptr;
    FcPattern* smallest = nullptr;
    FcChar32 largestCount = 0, smallestCount = 0;
    FcCharSet* all = FcCharSetCreate();
    int withCoverage = 0;
    for (int i = 0; fonts && i < fonts->nfont; ++i) {
        FcCharSet* charset = nullptr;
        if (FcPatternGetCharSet(fonts->fonts[i], FC_CHARSET, 0, &charset) != FcResultMatch)
            continue;
        const FcChar32 count = FcCharSetCount(charset);
        if (count == 0)
            continue;
        ++withCoverage;
        FcCharSetMerge(all, charset, nullptr);
        if (!largest || count > largestCount)
            largest = fonts->fonts[i], largestCount = count;
        if (!smallest || count < smallestCount)
            smallest = fonts->fonts[i], smallestCount = count;
    }

    if (withCoverage == 0) {
        for (const char* name : {"font-largest-BMP", "font-largest", "font-smallest", "font-union"})
            inputs.push_back({name, {}, "fontconfig found no fonts with a character set"});
    } else {
        FcCharSet* charset = nullptr;
        FcPatternGetCharSet(largest, FC_CHARSET, 0, &charset);
        std::vector<UInt8> bytes = BitmapRepresentation(charset);
        const std::string largestLabel = Label(largest) + "_" + std::to_string(largestCount);
        inputs.push_back({"font-largest-BMP:" + largestLabel,
                          std::vector<UInt8>(bytes.begin(), bytes.begin() + kPlaneBytes), ""});
        inputs.push_back({"font-largest:" + largestLabel, bytes, ""});
        FcPatternGetCharSet(smallest, FC_CHARSET, 0, &charset);
        inputs.push_back({"font-smallest:" + Label(smallest) + "_" + std::to_string(smallestCount),
                          BitmapRepresentation(charset), ""});
        inputs.push_back({"font-union:" + std::to_string(withCoverage) + "_fonts_" +
                              std::to_string(FcCharSetCount(all)),
                          BitmapRepresentation(all), ""});
    }
    FcCharSetDestroy(all);
    if (fonts)
        FcFontSetDestroy(fonts);
    FcObjectSetDestroy(objects);
    FcPatternDestroy(pattern);
    if (config)
        FcConfigDestroy(config);
    return inputs;
}

std::vector<Input> Inputs() {
    std::vector<Input> inputs;
    inputs.push_back({"empty-BMP", std::vector<UInt8>(kPlaneBytes, 0x00), ""});
    inputs.push_back({"full-BMP", std::vector<UInt8>(kPlaneBytes, 0xFF), ""});
    for (Input& input : FontInputs())
        inputs.push_back(std::move(input));
    return inputs;
}

bool Usable(benchmark::State& state, const Input& input) {
    if (input.bytes.empty()) {
        state.SkipWithError(input.missingReason.c_str());
        return false;
    }
    return true;
}

void Finish(benchmark::State& state, const Input& input, size_t compressedLength) {
    state.SetBytesProcessed(int64_t(input.bytes.size()) * int64_t(state.iterations()));
    state.counters["compressed_bytes"] = double(compressedLength);
    state.counters["uncompressed_bytes"] = double(input.bytes.size());
}

std::vector<UInt8> QZCompressed(const Input& input) {
    CFDataRef data =
        QZCreateCompressedBitmapRepresentation(input.bytes.data(), CFIndex(input.bytes.size()));
    std::vector<UInt8> bytes(CFDataGetBytePtr(data),
                             CFDataGetBytePtr(data) + CFDataGetLength(data));
    CFRelease(data);
    return bytes;
}

std::vector<UInt8> ZlibCompressed(const Input& input, int level) {
    std::vector<UInt8> bytes(compressBound(uLong(input.bytes.size())));
    uLongf length = bytes.size();
    compress2(bytes.data(), &length, input.bytes.data(), uLong(input.bytes.size()), level);
    bytes.resize(length);
    return bytes;
}

void CompressQZ(benchmark::State& state, const Input& input) {
    if (!Usable(state, input))
        return;
    size_t compressed = 0;
    for (auto _ : state) {
        CFDataRef data =
            QZCreateCompressedBitmapRepresentation(input.bytes.data(), CFIndex(input.bytes.size()));
        compressed = size_t(CFDataGetLength(data));
        benchmark::DoNotOptimize(CFDataGetBytePtr(data));
        CFRelease(data);
    }
    Finish(state, input, compressed);
}

void CompressZlib(benchmark::State& state, const Input& input, int level) {
    if (!Usable(state, input))
        return;
    std::vector<UInt8> output(compressBound(uLong(input.bytes.size())), 1);
    uLongf length = 0;
    for (auto _ : state) {
        length = output.size();
        if (compress2(output.data(), &length, input.bytes.data(), uLong(input.bytes.size()),
                      level) != Z_OK) {
            state.SkipWithError("compress2 failed");
            return;
        }
        benchmark::DoNotOptimize(output.data());
        benchmark::ClobberMemory();
    }
    Finish(state, input, length);
}

void DecompressQZ(benchmark::State& state, const Input& input) {
    if (!Usable(state, input))
        return;
    const std::vector<UInt8> compressed = QZCompressed(input);
    CFDataRef check =
        QZCopyUncompressedBitmapRepresentation(compressed.data(), CFIndex(compressed.size()));
    const bool roundTrips =
        check && size_t(CFDataGetLength(check)) == input.bytes.size() &&
        std::memcmp(CFDataGetBytePtr(check), input.bytes.data(), input.bytes.size()) == 0;
    if (check)
        CFRelease(check);
    if (!roundTrips) {
        state.SkipWithError("the compressed bytes do not restore the input");
        return;
    }
    for (auto _ : state) {
        CFDataRef data =
            QZCopyUncompressedBitmapRepresentation(compressed.data(), CFIndex(compressed.size()));
        benchmark::DoNotOptimize(CFDataGetBytePtr(data));
        CFRelease(data);
    }
    Finish(state, input, compressed.size());
}

void DecompressZlib(benchmark::State& state, const Input& input, int level) {
    if (!Usable(state, input))
        return;
    const std::vector<UInt8> compressed = ZlibCompressed(input, level);
    std::vector<UInt8> output(input.bytes.size(), 1);
    for (auto _ : state) {
        uLongf length = output.size();
        if (uncompress(output.data(), &length, compressed.data(), uLong(compressed.size())) !=
                Z_OK ||
            length != input.bytes.size()) {
            state.SkipWithError("uncompress failed");
            return;
        }
        benchmark::DoNotOptimize(output.data());
        benchmark::ClobberMemory();
    }
    if (std::memcmp(output.data(), input.bytes.data(), output.size()) != 0)
        state.SkipWithError("uncompress did not restore the input");
    Finish(state, input, compressed.size());
}

} // namespace

int main(int argc, char** argv) {
    // The inputs live for the process; the benchmarks refer to them.
    static const std::vector<Input> inputs = Inputs();
    for (const Input& input : inputs) {
        const Input* shared = &input;
        const std::string compress = "Compress/" + input.name + "/";
        const std::string decompress = "Decompress/" + input.name + "/";
        benchmark::RegisterBenchmark((compress + "QZ").c_str(),
                                     [shared](benchmark::State& s) { CompressQZ(s, *shared); });
        benchmark::RegisterBenchmark((compress + "zlib-1").c_str(), [shared](benchmark::State& s) {
            CompressZlib(s, *shared, 1);
        });
        benchmark::RegisterBenchmark((compress + "zlib-6").c_str(), [shared](benchmark::State& s) {
            CompressZlib(s, *shared, 6);
        });
        benchmark::RegisterBenchmark((decompress + "QZ").c_str(),
                                     [shared](benchmark::State& s) { DecompressQZ(s, *shared); });
        benchmark::RegisterBenchmark(
            (decompress + "zlib-1").c_str(),
            [shared](benchmark::State& s) { DecompressZlib(s, *shared, 1); });
        benchmark::RegisterBenchmark(
            (decompress + "zlib-6").c_str(),
            [shared](benchmark::State& s) { DecompressZlib(s, *shared, 6); });
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
