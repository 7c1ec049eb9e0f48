#pragma once

#include <cstdint>
#include <optional>
#include <string>

/** What a file system with an archive version keeps, and how it answers the two requests. */
class ArchiveVersion {
public:
    static constexpr std::uint32_t GET = 0xC0047879;
    static constexpr std::uint32_t INCREASE = 0x2000787B;

    /** All that is set, a line each: what set() takes. */
    std::string settings() const;
    /** Takes one line, as in "version 7". False if nothing is called that. */
    bool set(const std::string& line);

    /** Answers a request as ioctl() of a driver does: negative is an error number. */
    int answer(std::uint32_t request, void* data);

private:
    int increase();
    int get(void* data) const;

    std::uint32_t version = 0;
    int increaseResult = 0;
    int getResult = 0;
    std::optional<int> getResultAfterIncrease;
};
