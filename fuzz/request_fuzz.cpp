// Any request gets a reply that has a code. No backend is installed, so nothing
// is ever run; and no loop runs, so no timer can be set.

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include <marubackup/command_server.h>

#include "queue/requests.h"

using namespace MARU::Backup;

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    return std::freopen("/dev/null", "w", stderr) != nullptr ? 0 : 1;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static CommandServer server;
    const std::string reply =
        dispatchRequest(reinterpret_cast<const char*>(data), static_cast<unsigned int>(size), &server);
    if (reply.find("\"code\":") == std::string::npos) {
        std::abort();
    }
    return 0;
}
