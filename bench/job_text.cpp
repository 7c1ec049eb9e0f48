#include "job_text.h"

#include <cstdio>

namespace bench {

namespace {

std::string tenDigits(int number) {
    char text[16];
    std::snprintf(text, sizeof text, "%010d", number);
    return text;
}

} // namespace

std::string jobText(const JobShape& shape, int serial) {
    const std::string head = "{\"action\":" + std::to_string(shape.action) + ",\"backend\":\"" + shape.backend + "\"" +
                             (shape.branch.empty() ? "" : ",\"branch\":\"" + shape.branch + "\"") +
                             ",\"param\":{\"gate\":\"" + shape.gate + "\",\"name\":\"" + tenDigits(serial) +
                             "\",\"source\":\"/volume1/photos/";
    const std::string tail = "\"},\"status\":0,\"unique\":\"\"}";
    const std::size_t used = head.size() + tail.size();
    return head + std::string(shape.size > used ? shape.size - used : 0, 'x') + tail;
}

std::string enqueueRequest(const JobShape& shape, int serial) {
    return "{\"job\":" + jobText(shape, serial) + ",\"op\":\"job_enqueue\"}";
}

} // namespace bench
