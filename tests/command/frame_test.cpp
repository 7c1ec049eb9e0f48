#include "command/frame.h"

#include <cstddef>
#include <cstdint>

#include <gtest/gtest.h>

using namespace MARU::Backup;

namespace {

struct NumberedHeader {
    std::uint32_t length;
    FrameHeader header;
};

const NumberedHeader HEADERS[] = {
    {0, {0, 0, 0, 0}},
    {1, {0, 0, 0, 1}},
    {255, {0, 0, 0, 0xFF}},
    {256, {0, 0, 1, 0}},
    {300, {0, 0, 0x01, 0x2C}},
    {16380, {0, 0, 0x3F, 0xFC}},
    {0x01020304, {1, 2, 3, 4}},
    {0x7FFFFFFF, {0x7F, 0xFF, 0xFF, 0xFF}},
    {0x80000000, {0x80, 0, 0, 0}},
    {0xFFFFFFFF, {0xFF, 0xFF, 0xFF, 0xFF}},
};

struct Arrival {
    std::uint32_t length;
    std::size_t waiting;
    FrameState state;
};

const Arrival ARRIVALS[] = {
    {0, 4, FRAME_COMPLETE},
    {0, 5, FRAME_COMPLETE}, // the next frame has begun
    {1, 4, FRAME_INCOMPLETE},
    {1, 5, FRAME_COMPLETE},
    {300, 303, FRAME_INCOMPLETE},
    {300, 304, FRAME_COMPLETE},
    {300, 16384, FRAME_COMPLETE},
    {16380, 16383, FRAME_INCOMPLETE},
    {16380, 16384, FRAME_COMPLETE},
    {16381, 16384, FRAME_INCOMPLETE},
    {0x7FFFFFFF, 16384, FRAME_INCOMPLETE},
    {0x7FFFFFFF, std::size_t{0x7FFFFFFF} + 3, FRAME_INCOMPLETE},
    {0x7FFFFFFF, std::size_t{0x7FFFFFFF} + 4, FRAME_COMPLETE},
    {0x80000000, 4, FRAME_REFUSED},
    {0x80000000, 16384, FRAME_REFUSED},
    {0xFFFFFFFF, 4, FRAME_REFUSED},
};

} // namespace

TEST(AFrameHeader, IsTheLengthWithTheMostSignificantByteFirst) {
    for (const NumberedHeader& one : HEADERS) {
        EXPECT_EQ(one.header, frameHeader(one.length)) << one.length;
        EXPECT_EQ(one.length, frameLength(one.header)) << one.length;
    }
}

TEST(ARequest, IsCompleteWithItsLastByteAndRefusedFromTwoGigabytesOn) {
    for (const Arrival& one : ARRIVALS) {
        EXPECT_EQ(one.state, requestState(frameHeader(one.length), one.waiting))
            << one.waiting << " bytes of a frame of " << one.length;
    }
}
