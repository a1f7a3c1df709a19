// The wire codec's frame reassembly: the length cap, and bodies received in place.
#include <gtest/gtest.h>

#include <algorithm>
#include <tuple>
#include <utility>
#include <vector>

#include "protocol/MessagePortWire.h"

using glyphwell::port::Frame;
using glyphwell::port::FrameAssembler;

TEST(FrameAssembler, RefusesALengthOverItsCapForGood) {
    const uint8_t atCap[] = {0, 0, 0, 16};
    const uint8_t over[] = {0, 0, 0, 17, 'x'};
    FrameAssembler accepting(FrameAssembler::Kind::Reply, 16);
    EXPECT_TRUE(accepting.Append(atCap, sizeof atCap));
    EXPECT_EQ(std::pair(accepting.IsMidFrame(), accepting.Failed()), std::pair(true, false));
    FrameAssembler refusing(FrameAssembler::Kind::Reply, 16);
    EXPECT_FALSE(refusing.Append(over, sizeof over));
    EXPECT_EQ(std::tuple(refusing.Failed(), refusing.RefusedLength(), refusing.BufferedBytes()),
              std::tuple(true, size_t(17), size_t(0)));
    EXPECT_FALSE(refusing.Append(atCap, sizeof atCap));
    EXPECT_FALSE(refusing.HasFrame());
}

TEST(FrameAssembler, ReceivesABodyInPlaceWithMemoryFollowingWhatArrived) {
    FrameAssembler assembler(FrameAssembler::Kind::Request, 1u << 20);
    size_t room = 0;
    EXPECT_EQ(assembler.BodyRoom(&room), nullptr) << "no body between frames";
    const uint8_t header[] = {0, 0, 0, 9, 0, 3, 0x0D, 0x40}; // 200,000 bytes
    ASSERT_TRUE(assembler.Append(header, sizeof header));
    size_t received = 0;
    while (!assembler.HasFrame()) {
        uint8_t* target = assembler.BodyRoom(&room);
        ASSERT_NE(target, nullptr);
        ASSERT_GT(room, 0u);
        EXPECT_LE(room, std::max<size_t>(65536, 2 * received)) << "room beyond what arrived";
        const size_t count = std::min<size_t>(room, 1000);
        for (size_t i = 0; i < count; ++i)
            target[i] = uint8_t((received + i) % 251);
        assembler.CommitBody(count);
        received += count;
    }
    Frame frame = assembler.TakeFrame();
    EXPECT_EQ(frame.msgid, 9);
    std::vector<uint8_t> expected(200000);
    for (size_t i = 0; i < expected.size(); ++i)
        expected[i] = uint8_t(i % 251);
    EXPECT_TRUE(std::vector<uint8_t>(frame.body.Data(), frame.body.Data() + frame.body.Size()) ==
                expected);
    EXPECT_EQ(assembler.BufferedBytes(), 0u);
}
