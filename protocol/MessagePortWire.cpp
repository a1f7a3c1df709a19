#include "protocol/MessagePortWire.h"

#include <sys/socket.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <utility>

namespace glyphwell::port {

namespace {

/// The least room a body grows by, so that small reads do not reallocate often.
constexpr size_t kMinimumGrowth = 64 * 1024;

} // namespace

// --- FrameBody ------------------------------------------------------------------------------

FrameBody::~FrameBody() {
    std::free(bytes_);
}

FrameBody::FrameBody(FrameBody&& other) noexcept
    : bytes_(std::exchange(other.bytes_, nullptr)), size_(std::exchange(other.size_, 0)),
      capacity_(std::exchange(other.capacity_, 0)) {}

FrameBody& FrameBody::operator=(FrameBody&& other) noexcept {
    if (this != &other) {
        std::free(bytes_);
        bytes_ = std::exchange(other.bytes_, nullptr);
        size_ = std::exchange(other.size_, 0);
        capacity_ = std::exchange(other.capacity_, 0);
    }
    return *this;
}

uint8_t* FrameBody::Release() {
    if (size_ == 0) {
        std::free(bytes_);
        bytes_ = nullptr;
        capacity_ = 0;
        return nullptr;
    }
    size_ = 0;
    capacity_ = 0;
    return std::exchange(bytes_, nullptr);
}

bool FrameBody::Reserve(size_t capacity) {
    if (capacity <= capacity_)
        return true;
    void* grown = std::realloc(bytes_, capacity);
    if (!grown)
        return false;
    bytes_ = static_cast<uint8_t*>(grown);
    capacity_ = capacity;
    return true;
}

// --- FrameAssembler -------------------------------------------------------------------------

FrameAssembler::FrameAssembler(Kind kind, uint32_t maxBody) : kind_(kind), maxBody_(maxBody) {}

void FrameAssembler::Fail(uint32_t length) {
    refusedLength_ = length;
    Clear();
    failed_ = true;
}

bool FrameAssembler::MakeRoom(size_t wanted) {
    FrameBody& body = current_.body;
    const size_t remaining = bodyLength_ - body.size_;
    wanted = std::min(wanted, remaining);
    if (body.capacity_ - body.size_ >= wanted)
        return true;
    // Geometric growth bounded by the announced length: memory follows what arrives.
    const size_t capacity =
        std::min(size_t(bodyLength_),
                 std::max(body.size_ + wanted, std::max(2 * body.capacity_, kMinimumGrowth)));
    return body.Reserve(capacity);
}

void FrameAssembler::FinishFrameIfWhole() {
    if (headerFill_ == HeaderSize() && current_.body.size_ == bodyLength_) {
        frames_.push_back(std::move(current_));
        current_ = Frame();
        headerFill_ = 0;
    }
}

bool FrameAssembler::Append(const uint8_t* bytes, size_t length) {
    if (failed_)
        return false;
    const size_t headerSize = HeaderSize();
    while (length > 0) {
        if (headerFill_ < headerSize) {
            const size_t take = std::min(length, headerSize - headerFill_);
            std::memcpy(header_ + headerFill_, bytes, take);
            headerFill_ += take;
            buffered_ += take;
            bytes += take;
            length -= take;
            if (headerFill_ < headerSize)
                break;
            const bool request = kind_ == Kind::Request;
            bodyLength_ = LoadBigEndian32(header_ + (request ? 4 : 0));
            if (bodyLength_ > maxBody_) {
                Fail(bodyLength_);
                return false;
            }
            current_.msgid = request ? int32_t(LoadBigEndian32(header_)) : 0;
        } else {
            const size_t take = std::min(length, size_t(bodyLength_) - current_.body.size_);
            if (!MakeRoom(take)) {
                Fail(bodyLength_);
                return false;
            }
            std::memcpy(current_.body.bytes_ + current_.body.size_, bytes, take);
            current_.body.size_ += take;
            buffered_ += take;
            bytes += take;
            length -= take;
        }
        FinishFrameIfWhole();
    }
    return true;
}

uint8_t* FrameAssembler::BodyRoom(size_t* room) {
    *room = 0;
    if (!InBody())
        return nullptr;
    const size_t remaining = bodyLength_ - current_.body.size_;
    // Grow only once the room is used up: the room offered then doubles with what arrived.
    if (!MakeRoom(1)) {
        Fail(bodyLength_);
        return nullptr;
    }
    FrameBody& body = current_.body;
    *room = std::min(remaining, body.capacity_ - body.size_);
    return body.bytes_ + body.size_;
}

void FrameAssembler::CommitBody(size_t count) {
    if (!InBody())
        return;
    FrameBody& body = current_.body;
    count = std::min(count, std::min(size_t(bodyLength_), body.capacity_) - body.size_);
    body.size_ += count;
    buffered_ += count;
    FinishFrameIfWhole();
}

Frame FrameAssembler::TakeFrame() {
    Frame frame = std::move(frames_.front());
    frames_.pop_front();
    buffered_ -= HeaderSize() + frame.body.Size();
    return frame;
}

void FrameAssembler::DropPartial() {
    buffered_ -= PartialBytes();
    current_ = Frame();
    headerFill_ = 0;
    bodyLength_ = 0;
}

void FrameAssembler::Clear() {
    frames_.clear();
    current_ = Frame();
    headerFill_ = 0;
    bodyLength_ = 0;
    buffered_ = 0;
}

ssize_t ReceiveInto(int descriptor, FrameAssembler& assembler, std::vector<uint8_t>& buffer,
                    bool* drained, bool blocking) {
    *drained = false;
    size_t room = 0;
    uint8_t* target = assembler.BodyRoom(&room);
    if (assembler.Failed())
        return 1;
    const bool direct = target != nullptr;
    if (!direct) {
        target = buffer.data();
        room = buffer.size();
    }
    const ssize_t got = recv(descriptor, target, room, blocking ? 0 : MSG_DONTWAIT);
    if (got > 0) {
        *drained = size_t(got) < room;
        if (direct)
            assembler.CommitBody(size_t(got));
        else
            assembler.Append(buffer.data(), size_t(got));
    }
    return got;
}

} // namespace glyphwell::port
