// Put before the library by LD_PRELOAD: a server that refuses one kind of
// registration, the one that REFUSED_REGISTRATION names. The real server never
// refuses any, so the daemon's answer to it can be seen no other way.

#include <cstdlib>
#include <cstring>

#include <marubackup/command_server.h>

namespace MARU {
namespace Backup {

namespace {

bool accepts(const char* registration) {
    const char* const refused = std::getenv("REFUSED_REGISTRATION");
    return refused == nullptr || std::strcmp(refused, registration) != 0;
}

} // namespace

bool CommandServer::setLoopHandler(const LoopHandler&) {
    return accepts("loop");
}

bool CommandServer::setSignalHandler(int, const SignalHandler&) {
    return accepts("signal");
}

bool CommandServer::setWatchFolder(const std::string&, const WatchHandler&) {
    return accepts("watch");
}

} // namespace Backup
} // namespace MARU
