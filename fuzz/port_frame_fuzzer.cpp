// The message port's frame reassembly over untrusted bytes. Input: a mode byte (bit 0: requests,
// else replies; bit 1: the 64 MiB cap, else 64 bytes), a piece size byte (0 counts as 1), then the
// stream, fed in pieces alternately through Append and in place through BodyRoom/CommitBody.
// Every frame must respect the cap, and the bytes held must match what went in and came out.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>

#include "FuzzSupport.h"
#include "platform/CFMessagePort.h"
#include "protocol/MessagePortWire.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using glyphwell::port::FrameAssembler;
    if (size < 2)
        return 0;
    const bool requests = data[0] & 1;
    const uint32_t cap = data[0] & 2 ? kMessagePortMaxFrame : 64;
    const size_t headerSize =
        requests ? glyphwell::port::kRequestHeaderSize : glyphwell::port::kReplyHeaderSize;
    const size_t piece = data[1] ? data[1] : 1;
    FrameAssembler assembler(requests ? FrameAssembler::Kind::Request : FrameAssembler::Kind::Reply,
                             cap);
    size_t at = 2, fed = 0, takenOut = 0;
    bool inPlace = false;
    while (at < size) {
        size_t count = std::min(piece, size - at);
        size_t room = 0;
        uint8_t* target = inPlace ? assembler.BodyRoom(&room) : nullptr;
        if (target && room > 0) {
            count = std::min(count, room);
            std::memcpy(target, data + at, count);
            assembler.CommitBody(count);
        } else if (!assembler.Append(data + at, count)) {
            fuzz::Check(assembler.Failed() && assembler.RefusedLength() > cap);
            fuzz::Check(assembler.BufferedBytes() == 0 && !assembler.HasFrame());
            return 0;
        }
        at += count;
        fed += count;
        inPlace = !inPlace;
        while (assembler.HasFrame()) {
            glyphwell::port::Frame frame = assembler.TakeFrame();
            fuzz::Check(frame.body.Size() <= cap);
            fuzz::Check(frame.body.Size() == 0 || frame.body.Data() != nullptr);
            takenOut += headerSize + frame.body.Size();
        }
        fuzz::Check(assembler.BufferedBytes() == fed - takenOut);
    }
    return 0;
}
