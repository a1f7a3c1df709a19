#include "platform/MessagePortWire.h"

#include <algorithm>
#include <cstring>

namespace glyphwell::port {

FrameAssembler::FrameAssembler(Kind kind, uint32_t maxBody) : kind_(kind), maxBody_(maxBody) {}

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
                refusedLength_ = bodyLength_;
                Clear();
                failed_ = true;
                return false;
            }
            current_.msgid = request ? int32_t(LoadBigEndian32(header_)) : 0;
            current_.body.clear();
        } else {
            // Growth follows what arrived, never the announced length alone.
            const size_t take = std::min(length, size_t(bodyLength_) - current_.body.size());
            current_.body.insert(current_.body.end(), bytes, bytes + take);
            buffered_ += take;
            bytes += take;
            length -= take;
        }
        if (current_.body.size() == bodyLength_) {
            frames_.push_back(std::move(current_));
            current_ = Frame();
            headerFill_ = 0;
        }
    }
    return true;
}

Frame FrameAssembler::TakeFrame() {
    Frame frame = std::move(frames_.front());
    frames_.pop_front();
    buffered_ -= HeaderSize() + frame.body.size();
    return frame;
}

void FrameAssembler::Clear() {
    frames_.clear();
    current_ = Frame();
    headerFill_ = 0;
    bodyLength_ = 0;
    buffered_ = 0;
}

} // namespace glyphwell::port
