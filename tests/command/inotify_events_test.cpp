#include "command/inotify_events.h"

#include <sys/inotify.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

using MARU::Backup::INOTIFY_BUFFER_SIZE;
using MARU::Backup::walkInotifyEvents;

namespace {

const std::size_t HEADER_SIZE = 16;
const std::size_t LONGEST_NAME = 256;

/** An event as a handler saw it. */
struct Seen {
    int wd;
    std::uint32_t mask;
    std::uint32_t cookie;
    std::string name; ///< all of its `len` bytes
};

bool operator==(const Seen& one, const Seen& other) {
    return one.wd == other.wd && one.mask == other.mask && one.cookie == other.cookie && one.name == other.name;
}

std::string inNumbers(const Seen& seen) {
    return std::to_string(seen.wd) + " " + std::to_string(seen.mask) + " " + std::to_string(seen.cookie) + " [" +
           seen.name + "]";
}

std::string padded(std::string name, std::size_t size) {
    name.resize(size, '\0');
    return name;
}

/** An event's bytes as the kernel writes them, with `len` announced whatever the name is. */
std::string bytesOf(const Seen& event, std::uint32_t len) {
    std::string bytes;
    for (const std::uint32_t field : {static_cast<std::uint32_t>(event.wd), event.mask, event.cookie, len}) {
        bytes.append(reinterpret_cast<const char*>(&field), sizeof field);
    }
    return bytes + event.name;
}

std::string bytesOf(const Seen& event) {
    return bytesOf(event, static_cast<std::uint32_t>(event.name.size()));
}

/** Walks a copy that ends where its memory ends, so that a look behind it is found out. */
std::vector<Seen> walk(const std::string& bytes) {
    const std::vector<char> exact(bytes.begin(), bytes.end());
    std::vector<Seen> seen;
    walkInotifyEvents(exact.data(), exact.size(), [&seen](inotify_event* event) {
        seen.push_back({event->wd, event->mask, event->cookie, std::string(event->name, event->len)});
    });
    return seen;
}

const std::vector<Seen> EVENTS = {
    {1, IN_CREATE, 0, padded("a.conf", 16)},
    {2, IN_DELETE_SELF, 0, ""},
    {0x01020304, IN_MOVED_FROM, 7, padded(std::string(255, 'n'), LONGEST_NAME)},
    {3, IN_MOVED_TO, 7, padded("b", 32)},
};

/** What is to be seen of `event` when only its first `size` bytes are there. */
Seen cut(const Seen& event, std::size_t size) {
    const std::string there = padded(bytesOf(event).substr(0, size), HEADER_SIZE + LONGEST_NAME);
    std::uint32_t fields[4];
    std::memcpy(fields, there.data(), sizeof fields);
    return {static_cast<int>(fields[0]), fields[1], fields[2], there.substr(HEADER_SIZE, fields[3])};
}

} // namespace

TEST(InotifyEvents, HaveRoomForTenOfTheLongestNames) {
    EXPECT_EQ(2720U, +INOTIFY_BUFFER_SIZE);
}

TEST(InotifyEvents, AreHandedOnOneByOneWithTheirNames) {
    std::string bytes;
    for (const Seen& event : EVENTS) {
        bytes += bytesOf(event);
    }

    EXPECT_TRUE(EVENTS == walk(bytes));
}

TEST(InotifyEvents, OfAnEmptyBufferAreNone) {
    EXPECT_TRUE(walk("").empty());
}

TEST(InotifyEvents, AreHandedOnAsFarAsTheyGoWhereverTheBufferIsCut) {
    std::string whole;
    std::vector<Seen> complete;
    for (const Seen& event : EVENTS) {
        for (std::size_t size = 1; size <= bytesOf(event).size(); ++size) {
            std::vector<Seen> expected = complete;
            expected.push_back(cut(event, size));

            const std::vector<Seen> seen = walk(whole + bytesOf(event).substr(0, size));

            ASSERT_EQ(expected.size(), seen.size()) << whole.size() + size << " bytes";
            ASSERT_TRUE(expected == seen) << whole.size() + size << " bytes: " << inNumbers(seen.back());
        }
        whole += bytesOf(event);
        complete.push_back(event);
    }
}

TEST(InotifyEvents, NeverReachOutOfTheBufferWhateverLengthTheyAnnounce) {
    const Seen first = {1, IN_CREATE, 0, padded("first", 16)};
    for (const std::uint32_t announced :
         {0x11U, 0xFFU, 0x100U, 0x101U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFEFU, 0xFFFFFFF0U, 0xFFFFFFF1U, 0xFFFFFFFFU}) {
        const Seen last = {2, IN_DELETE, 0, padded("last", 16)};

        const std::vector<Seen> seen = walk(bytesOf(first) + bytesOf(last, announced));

        ASSERT_EQ(2U, seen.size()) << announced;
        EXPECT_EQ(inNumbers(first), inNumbers(seen[0])) << announced;
        EXPECT_EQ(2, seen[1].wd) << announced;
        const std::size_t handedOn = std::min<std::size_t>(announced, LONGEST_NAME);
        EXPECT_EQ(padded("last", handedOn), seen[1].name) << announced;
    }
}

TEST(InotifyEvents, MayBeChangedByTheHandlerWithoutHarm) {
    std::vector<int> seen;
    const std::string bytes = bytesOf(EVENTS[0]) + bytesOf(EVENTS[1]) + bytesOf(EVENTS[2]);

    walkInotifyEvents(bytes.data(), bytes.size(), [&seen](inotify_event* event) {
        seen.push_back(event->wd);
        event->len = 0xFFFFFFFF;
        event->wd = -1;
    });

    EXPECT_EQ((std::vector<int>{1, 2, 0x01020304}), seen);
}
