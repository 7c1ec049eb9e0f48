#include <fcntl.h>
#include <unistd.h>

#include "clock.h"
#include "stamp_record.h"

// A job that tells when it ran.
//
//     stamp FIFO [GATE]
//
// It writes its record into FIFO. With GATE, a FIFO too, it first waits for a
// byte from there, and so holds its slot until it is let go.

namespace {

void waitAt(const char* gate) {
    char byte = 0;
    ssize_t got = 0;
    while (got != 1) {
        // The end of the input is only the end of one who let another stamp go.
        const int fd = open(gate, O_RDONLY | O_CLOEXEC);
        if (fd < 0) {
            _exit(1);
        }
        got = read(fd, &byte, 1);
        close(fd);
    }
}

} // namespace

int main(int argc, char** argv) {
    bench::StampRecord record = {bench::now(), 0};
    if (argc < 2) {
        return 2;
    }
    if (argc > 2) {
        waitAt(argv[2]);
    }
    const int fd = open(argv[1], O_WRONLY | O_CLOEXEC);
    record.end = bench::now();
    return write(fd, &record, sizeof record) == static_cast<ssize_t>(sizeof record) ? 0 : 1;
}
