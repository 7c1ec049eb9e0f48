#pragma once

#include <string>

#include "stamp_record.h"

namespace bench {

/** The reading end of the FIFO that stamps write into; what cannot be opened or read is an exception. */
class Stamps {
public:
    explicit Stamps(const std::string& fifo);
    ~Stamps();
    Stamps(const Stamps&) = delete;
    Stamps& operator=(const Stamps&) = delete;

    /** Waits for the next record. */
    StampRecord next();

private:
    int fd;
};

} // namespace bench
