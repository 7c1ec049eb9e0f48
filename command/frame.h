#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace MARU {
namespace Backup {

// A frame is the size of its payload, four bytes, most significant first, and
// then the payload. Requests and replies have the same form.

using FrameHeader = std::array<unsigned char, 4>;

/** The header of a frame with `length` bytes of payload. */
inline FrameHeader frameHeader(std::uint32_t length) {
    return {static_cast<unsigned char>(length >> 24), static_cast<unsigned char>(length >> 16),
            static_cast<unsigned char>(length >> 8), static_cast<unsigned char>(length)};
}

/** The size of the payload that `header` announces. */
inline std::uint32_t frameLength(const FrameHeader& header) {
    return std::uint32_t{header[0]} << 24 | std::uint32_t{header[1]} << 16 | std::uint32_t{header[2]} << 8 |
           std::uint32_t{header[3]};
}

enum FrameState {
    FRAME_INCOMPLETE, ///< more bytes have to arrive
    FRAME_COMPLETE,
    FRAME_REFUSED, ///< announces more than 2^31 - 1 bytes, which no server takes
};

/** What a server can do with a request when `waiting` bytes of it, header included, have arrived. */
inline FrameState requestState(const FrameHeader& header, std::size_t waiting) {
    const std::uint32_t length = frameLength(header);
    if (length > INT32_MAX) {
        return FRAME_REFUSED;
    }
    return waiting - header.size() >= length ? FRAME_COMPLETE : FRAME_INCOMPLETE;
}

} // namespace Backup
} // namespace MARU
