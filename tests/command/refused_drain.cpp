#include "refused_drain.h"

#include <event2/buffer.h>

// libevent refuses to drain only a buffer that is frozen at its front, as it is
// for the moment that the socket's data are moved into it: no client and no
// kernel can bring that about. So the linker puts a function of ours in its place
// (--wrap), which passes everything on but the call that a test wants refused.

namespace {

bool refuseNext = false;

} // namespace

void refuseNextDrain() {
    refuseNext = true;
}

extern "C" int __real_evbuffer_drain(evbuffer* buffer, size_t size);
extern "C" int __wrap_evbuffer_drain(evbuffer* buffer, size_t size);

int __wrap_evbuffer_drain(evbuffer* buffer, size_t size) {
    if (refuseNext) {
        refuseNext = false;
        return -1;
    }
    return __real_evbuffer_drain(buffer, size);
}
