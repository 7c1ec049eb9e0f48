#include "support/descriptor_reader.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <csignal>
#include <utility>

namespace support {

DescriptorReader::DescriptorReader(int descriptor, std::function<bool()> readSome)
    : fd(descriptor), stop(eventfd(0, EFD_CLOEXEC)), read(std::move(readSome)) {
    sigset_t all;
    sigset_t old;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &old);
    thread = std::thread(&DescriptorReader::run, this);
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
}

DescriptorReader::~DescriptorReader() {
    eventfd_write(stop, 1);
    thread.join();
    close(stop);
    close(fd);
}

void DescriptorReader::run() {
    while (true) {
        pollfd entries[] = {{fd, POLLIN, 0}, {stop, POLLIN, 0}};
        if (poll(entries, 2, -1) < 0) {
            continue;
        }
        if (entries[1].revents != 0 || !read()) {
            return;
        }
    }
}

} // namespace support
