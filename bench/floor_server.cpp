#include <arpa/inet.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cstdint>
#include <cstdio>
#include <memory>
#include <sstream>
#include <string>

#include <event2/buffer.h>
#include <event2/bufferevent.h>
#include <event2/event.h>
#include <event2/listener.h>
#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>

// The floor: the same frames on the same kind of loop, the request parsed and the
// reply written by jsoncpp, and nothing else. Whatever job a request holds is
// what its reply says.
//
//     floor_server SOCKET

namespace {

std::unique_ptr<Json::CharReader> newReader() {
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

std::unique_ptr<Json::StreamWriter> newWriter() {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
}

const std::unique_ptr<Json::CharReader> READER = newReader();
const std::unique_ptr<Json::StreamWriter> WRITER = newWriter();

std::string answer(const char* data, std::size_t length) {
    Json::Value request;
    Json::Value reply(Json::objectValue);
    if (READER->parse(data, data + length, &request, nullptr)) {
        reply["job"].swap(request["job"]);
        reply["code"] = 200;
    } else {
        reply["code"] = 400;
    }
    std::ostringstream out;
    WRITER->write(reply, &out);
    return out.str();
}

void onReadable(bufferevent* connection, void*) {
    evbuffer* const input = bufferevent_get_input(connection);
    std::uint32_t header = 0;
    while (evbuffer_copyout(input, &header, sizeof header) == static_cast<ev_ssize_t>(sizeof header)) {
        const std::size_t length = ntohl(header);
        const unsigned char* const bytes = evbuffer_pullup(input, static_cast<ev_ssize_t>(sizeof header + length));
        if (bytes == nullptr) {
            return;
        }
        const std::string reply = answer(reinterpret_cast<const char*>(bytes) + sizeof header, length);
        const std::uint32_t replyLength = htonl(static_cast<std::uint32_t>(reply.size()));
        bufferevent_write(connection, &replyLength, sizeof replyLength);
        bufferevent_write(connection, reply.data(), reply.size());
        evbuffer_drain(input, sizeof header + length);
    }
}

void onEnd(bufferevent* connection, short, void*) {
    bufferevent_free(connection);
}

void onConnection(evconnlistener* listener, evutil_socket_t fd, sockaddr*, int, void*) {
    bufferevent* const connection =
        bufferevent_socket_new(evconnlistener_get_base(listener), fd, BEV_OPT_CLOSE_ON_FREE);
    bufferevent_setcb(connection, onReadable, nullptr, onEnd, nullptr);
    bufferevent_enable(connection, EV_READ | EV_WRITE);
}

} // namespace

int main(int argc, char** argv) {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    const std::string path = argc == 2 ? argv[1] : "";
    if (path.empty() || path.size() >= sizeof address.sun_path) {
        std::fputs("usage: floor_server SOCKET\n", stderr);
        return 2;
    }
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    event_base* const base = event_base_new();
    if (evconnlistener_new_bind(base, onConnection, nullptr, LEV_OPT_CLOSE_ON_FREE, 128,
                                reinterpret_cast<sockaddr*>(&address), sizeof address) == nullptr) {
        std::perror("floor_server");
        return 1;
    }
    return event_base_dispatch(base);
}
