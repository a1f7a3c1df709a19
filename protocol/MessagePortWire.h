// The message port's frames on the socket, the one codec of the agent's wire format, used by the
// port (platform/) and the client library (client/). It needs nothing else in the tree.
//
// The wire format: a Unix-domain stream socket carries requests from the client and replies from
// the server, all integers big-endian.
//   request = int32 msgid, uint32 length, `length` bytes
//   reply   = uint32 length, `length` bytes
// A connection carries any number of requests, one at a time: each request is answered by one
// reply before the next is read. The bytes are a flattened property value (a dictionary for the
// agent's two questions), or nothing. A frame whose length is over the receiver's cap (the port's
// kMessagePortMaxFrame, 64 MiB) breaks the connection.
//
// FrameAssembler turns bytes received in pieces of any size back into whole frames. It never
// trusts a length before checking it against its cap, and it allocates only for bytes that have
// arrived (at most twice those, at least 64 KiB), so a header announcing a large body costs
// little until the body comes. Bodies live in malloc'd memory that a data object can adopt
// without a copy, and large bodies can be received straight into place (BodyRoom, ReceiveInto).
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <vector>

namespace glyphwell::port {

inline constexpr size_t kRequestHeaderSize = 8;
inline constexpr size_t kReplyHeaderSize = 4;

inline void StoreBigEndian32(uint32_t value, uint8_t* out) {
    out[0] = uint8_t(value >> 24);
    out[1] = uint8_t(value >> 16);
    out[2] = uint8_t(value >> 8);
    out[3] = uint8_t(value);
}

inline uint32_t LoadBigEndian32(const uint8_t* in) {
    return uint32_t(in[0]) << 24 | uint32_t(in[1]) << 16 | uint32_t(in[2]) << 8 | uint32_t(in[3]);
}

/// Writes the header of a request frame with `msgid` and a body of `length` bytes.
inline void StoreRequestHeader(int32_t msgid, uint32_t length, uint8_t out[kRequestHeaderSize]) {
    StoreBigEndian32(uint32_t(msgid), out);
    StoreBigEndian32(length, out + 4);
}

/// A frame's body in malloc'd memory.
class FrameBody {
public:
    FrameBody() = default;
    ~FrameBody();
    FrameBody(FrameBody&& other) noexcept;
    FrameBody& operator=(FrameBody&& other) noexcept;
    FrameBody(const FrameBody&) = delete;
    FrameBody& operator=(const FrameBody&) = delete;

    const uint8_t* Data() const { return bytes_; }
    size_t Size() const { return size_; }
    /// Gives up the bytes: malloc'd memory the caller frees, null when empty.
    uint8_t* Release();

private:
    friend class FrameAssembler;
    /// Makes the capacity at least `capacity`; false when memory runs out.
    bool Reserve(size_t capacity);

    uint8_t* bytes_ = nullptr;
    size_t size_ = 0;
    size_t capacity_ = 0;
};

/// One whole frame. `msgid` is 0 for replies.
struct Frame {
    int32_t msgid = 0;
    FrameBody body;
};

/// Reassembles request or reply frames from a byte stream.
class FrameAssembler {
public:
    enum class Kind { Request, Reply };

    /// Frames whose body is longer than `maxBody` are refused.
    FrameAssembler(Kind kind, uint32_t maxBody);

    /// Takes `length` bytes of the stream. Returns false when a frame announces a body longer
    /// than the cap (or its memory cannot be had): the stream is then broken for good,
    /// everything held is dropped, and every later call returns false without keeping anything.
    bool Append(const uint8_t* bytes, size_t length);

    /// While a frame's body is being received: where up to `*room` more bytes of it can be
    /// received in place, to be followed by CommitBody with the count received. Null between
    /// frames (receive into a buffer and Append), and after a failure.
    /// NOTE: the pointer is valid until the next call that is not CommitBody.
    uint8_t* BodyRoom(size_t* room);
    /// Counts `count` bytes received at BodyRoom (`count` <= the room it gave).
    void CommitBody(size_t count);

    bool HasFrame() const { return !frames_.empty(); }
    /// Removes and returns the oldest whole frame. Call only when HasFrame().
    Frame TakeFrame();

    /// True when bytes of a frame that is not whole yet are held.
    bool IsMidFrame() const { return headerFill_ != 0; }
    /// Bytes held: whole frames not yet taken plus the frame in progress.
    size_t BufferedBytes() const { return buffered_; }
    /// Bytes received of the frame in progress (header included); 0 between frames.
    size_t PartialBytes() const {
        return headerFill_ == 0 ? 0 : headerFill_ + current_.body.Size();
    }
    /// Drops the frame in progress and keeps the whole frames.
    void DropPartial();
    bool Failed() const { return failed_; }
    /// The body length the refused frame announced (valid once Failed()).
    uint32_t RefusedLength() const { return refusedLength_; }
    /// Drops everything held; a failed assembler stays failed.
    void Clear();

private:
    size_t HeaderSize() const {
        return kind_ == Kind::Request ? kRequestHeaderSize : kReplyHeaderSize;
    }
    bool InBody() const { return !failed_ && headerFill_ == HeaderSize(); }
    /// Grows the body in progress so that `wanted` more bytes fit (within its announced length).
    bool MakeRoom(size_t wanted);
    void Fail(uint32_t length);
    void FinishFrameIfWhole();

    Kind kind_;
    uint32_t maxBody_;
    uint8_t header_[kRequestHeaderSize] = {};
    size_t headerFill_ = 0; ///< header bytes of the frame in progress; 0 between frames
    uint32_t bodyLength_ = 0;
    Frame current_;
    std::deque<Frame> frames_;
    size_t buffered_ = 0;
    bool failed_ = false;
    uint32_t refusedLength_ = 0;
};

/// Receives from `descriptor` into `assembler`: straight into the body in progress when there is
/// one, else through `buffer` (not empty). Returns what recv returned (errno set when negative; 0
/// is the end of the stream); `*drained` tells that fewer bytes came than there was room for, so
/// that the socket had nothing more at that moment. A refused frame leaves `assembler` Failed().
/// `blocking` waits for bytes (on a blocking socket); otherwise the call returns at once.
ssize_t ReceiveInto(int descriptor, FrameAssembler& assembler, std::vector<uint8_t>& buffer,
                    bool* drained, bool blocking = false);

} // namespace glyphwell::port
