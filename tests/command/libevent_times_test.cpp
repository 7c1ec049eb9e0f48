// libevent was built elsewhere: its times have the layout that they have in ours.

#include <event2/event.h>
#include <gtest/gtest.h>
#include <sys/time.h>

#include <algorithm>
#include <iterator>

namespace {

void ignore(evutil_socket_t, short, void*) {
}

} // namespace

TEST(LibeventTimes, HaveTheLayoutOfOurs) {
    event_base* const base = event_base_new();
    event* const timer = event_new(base, -1, 0, ignore, nullptr);
    const timeval delay = {1000, 0};
    struct {
        timeval when;
        unsigned char behind[32];
    } answer = {};

    ASSERT_EQ(0, event_add(timer, &delay));
    ASSERT_NE(0, event_pending(timer, EV_TIMEOUT, &answer.when));

    timeval now = {};
    gettimeofday(&now, nullptr);
    EXPECT_LE(answer.when.tv_sec, now.tv_sec + delay.tv_sec + 1);
    EXPECT_GE(answer.when.tv_sec, now.tv_sec + delay.tv_sec - 100) << "on a busy machine";
    EXPECT_LT(answer.when.tv_usec, 1000000);
    EXPECT_EQ(32, std::count(std::begin(answer.behind), std::end(answer.behind), 0)) << "it wrote behind it";
    event_free(timer);
    event_base_free(base);
}
