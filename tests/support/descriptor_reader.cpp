#include "support/descriptor_reader.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <csignal>
#include <future>
#include <mutex>
#include <set>
#include <utility>

namespace support {

namespace {

/**
 * Held while a reader works. Nobody forks meanwhile: the child would find the
 * allocator as the reader's thread had it at that moment, which the sanitizers'
 * does not survive.
 */
std::mutex working;

/** Those that there are now; the tests' main thread makes and destroys them. */
std::set<DescriptorReader*> readers;

void pauseForForks() {
    static const int registered =
        pthread_atfork([]() { working.lock(); }, []() { working.unlock(); }, []() { working.unlock(); });
    (void)registered;
}

} // namespace

DescriptorReader::DescriptorReader(int descriptor, std::function<bool()> readSome)
    : fd(descriptor), stop(eventfd(0, EFD_CLOEXEC)), read(std::move(readSome)) {
    pauseForForks();
    start();
    readers.insert(this);
}

DescriptorReader::~DescriptorReader() {
    readers.erase(this);
    end();
    close(stop);
    close(fd);
}

void DescriptorReader::pauseAll() {
    for (DescriptorReader* const reader : readers) {
        reader->end();
    }
}

void DescriptorReader::resumeAll() {
    for (DescriptorReader* const reader : readers) {
        reader->start();
    }
}

void DescriptorReader::forgetAll() {
    readers.clear();
}

void DescriptorReader::start() {
    sigset_t all;
    sigset_t old;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &old);
    std::promise<void> running;
    const std::future<void> started = running.get_future();
    thread = std::thread([this, running = std::move(running)]() mutable {
        running.set_value();
        run();
    });
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
    started.wait();
}

void DescriptorReader::end() {
    eventfd_write(stop, 1);
    thread.join();
    eventfd_t calls = 0;
    eventfd_read(stop, &calls);
}

void DescriptorReader::run() {
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
