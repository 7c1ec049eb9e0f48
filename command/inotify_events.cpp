#include "command/inotify_events.h"

#include <sys/inotify.h>

#include <algorithm>
#include <cstring>

namespace MARU {
namespace Backup {

void walkInotifyEvents(const char* buffer, std::size_t size, const boost::function<void(inotify_event*)>& handler) {
    const std::size_t headerSize = sizeof(inotify_event);
    for (std::size_t at = 0; at < size;) {
        // A copy of its own, aligned and zeroed: behind a cut event there is no
        // telling where the next one starts or what it announces.
        alignas(inotify_event) char room[headerSize + 256] = {};
        const std::size_t left = size - at;
        std::memcpy(room, buffer + at, std::min(left, sizeof room));
        inotify_event* event = reinterpret_cast<inotify_event*>(room);

        const std::size_t announced = event->len;
        event->len = static_cast<std::uint32_t>(std::min(announced, sizeof room - headerSize));
        handler(event);
        if (left <= headerSize || announced >= left - headerSize) {
            return;
        }
        at += headerSize + announced;
    }
}

} // namespace Backup
} // namespace MARU
