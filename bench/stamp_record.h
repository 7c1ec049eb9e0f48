#pragma once

namespace bench {

/** What a stamp writes of itself, at one stroke: when it began and when it ended. */
struct StampRecord {
    long long begin;
    long long end;
};

} // namespace bench
