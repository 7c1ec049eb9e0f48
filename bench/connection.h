#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace bench {

/** How replies end: by a length in front, or, as beanstalkd's, by the end of a line that may tell of a body. */
enum class Wire { FRAMES, LINES };

/** A frame with that payload. */
std::string frame(const std::string& payload);

/** A blocking client of a Unix socket. Whatever goes wrong is an exception. */
class Connection {
public:
    Connection(const std::string& path, Wire wire);
    ~Connection();
    Connection(Connection&& other) noexcept;
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;
    Connection& operator=(Connection&&) = delete;

    int descriptor() const {
        return fd;
    }

    void send(const std::string& bytes);
    /** Waits for the next reply; the text is good until the next call. */
    std::string_view receive();

private:
    /** The size of the whole reply at the front of what is unread; 0 if that does not say yet. */
    std::size_t replySize() const;
    std::string_view unread() const;
    void readMore(std::size_t wanted);

    int fd;
    Wire wire;
    std::vector<char> buffer;
    std::size_t begin = 0;
    std::size_t end = 0;
};

} // namespace bench
