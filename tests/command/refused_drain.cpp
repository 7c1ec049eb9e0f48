#include "refused_drain.h"

#include <dlfcn.h>

#include <event2/buffer.h>

// libevent refuses to drain only a buffer that is frozen at its front, as it is
// for the moment that the socket's data are moved into it: no client and no
// kernel can bring that about. So the function stands here in libevent's place,
// and passes everything on but the call that a test wants refused.

namespace {

bool refuseNext = false;

} // namespace

void refuseNextDrain() {
    refuseNext = true;
}

int evbuffer_drain(evbuffer* buffer, size_t size) {
    if (refuseNext) {
        refuseNext = false;
        return -1;
    }
    using Drain = int (*)(evbuffer*, size_t);
    static const auto drain = reinterpret_cast<Drain>(dlsym(RTLD_NEXT, "evbuffer_drain"));
    return drain(buffer, size);
}
