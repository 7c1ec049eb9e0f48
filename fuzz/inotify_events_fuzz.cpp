// Whatever stands in the buffer, the walk ends and stays inside it.

#include <sys/inotify.h>

#include <cstdint>
#include <string>

#include "command/inotify_events.h"

using namespace MARU::Backup;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    walkInotifyEvents(reinterpret_cast<const char*>(data), size,
                      [](inotify_event* event) { std::string(event->name, event->len); });
    return 0;
}
