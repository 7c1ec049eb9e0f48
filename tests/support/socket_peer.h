#pragma once

#include <chrono>
#include <string>

namespace support {

/** The daemon's socket, as everybody knows it. */
const char* const DAEMON_SOCKET = "/var/run/marubackupd.socket";

/** A frame as it goes over the wire, written out anew here so that nothing is tested against itself. */
std::string frame(const std::string& payload);

/**
 * A client that says exactly what a test tells it to, byte by byte. What it
 * waits for it waits for with patience; if that never comes, the test fails.
 */
class SocketPeer {
public:
    explicit SocketPeer(const std::string& path = DAEMON_SOCKET);
    /** Takes over a connected socket. */
    explicit SocketPeer(int connected);
    ~SocketPeer();
    SocketPeer(const SocketPeer&) = delete;
    SocketPeer& operator=(const SocketPeer&) = delete;

    int descriptor() const {
        return fd;
    }

    void write(const std::string& bytes);
    /** Reads exactly `size` bytes; fewer if the other side ends before that. */
    std::string read(std::size_t size);
    /** Reads one frame; its payload. */
    std::string readFrame();
    /** Sends a frame and reads one; the payload of that. */
    std::string ask(const std::string& payload);

    /** Waits for the other side to close the connection. */
    bool isClosed();
    /** Whether nothing comes for a while, and the connection stays open. */
    bool staysSilent();
    void close();

private:
    int fd;
};

/** A socket that listens at `path`, which must not exist; the caller closes it. */
int listenAt(const std::string& path);

} // namespace support
