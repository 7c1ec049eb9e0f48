#pragma once

#include <string>

namespace bench {

/** What a measurement wants its jobs to be like. */
struct JobShape {
    int action = 1;
    std::string backend = "bench";
    std::string branch;
    /** A parameter that the job's command may use. */
    std::string gate = "none";
    /** How many bytes the job's JSON text has, if its members are not more already. */
    std::size_t size = 250;
};

/** The JSON text of a job with three parameters, one of which, "name", is `serial`. */
std::string jobText(const JobShape& shape, int serial);

/** The request that enqueues that job. */
std::string enqueueRequest(const JobShape& shape, int serial);

} // namespace bench
