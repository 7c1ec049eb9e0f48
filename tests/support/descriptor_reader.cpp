#include "support/descriptor_reader.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <csignal>
#include <mutex>
#include <utility>

namespace support {

namespace {

/**
 * Held while a reader works. Nobody forks meanwhile: the child would find the
 * allocator as the reader's thread had it at that moment, which the sanitizers'
 * does not survive.
 */
std::mutex working;

void pauseForForks() {
    static const int registered =
        pthread_atfork([]() { working.lock(); }, []() { working.unlock(); }, []() { working.unlock(); });
    (void)registered;
}

} // namespace

DescriptorReader::DescriptorReader(int descriptor, std::function<bool()> readSome)
    : fd(descriptor), stop(eventfd(0, EFD_CLOEXEC)), read(std::move(readSome)) {
    pauseForForks();
    sigset_t all;
    sigset_t old;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &old);
    thread = std::thread(&DescriptorReader::run, this);
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
    running.get_future().wait();
}

DescriptorReader::~DescriptorReader() {
    eventfd_write(stop, 1);
    thread.join();
    close(stop);
    close(fd);
}

void DescriptorReader::run() {
    running.set_value();
    while (true) {
        pollfd entries[] = {{fd, POLLIN, 0}, {stop, POLLIN, 0}};
        if (poll(entries, 2, -1) < 0) {
            continue;
        }
        const std::lock_guard<std::mutex> lock(working);
        if (entries[1].revents != 0 || !read()) {
            return;
        }
    }
}

} // namespace support
