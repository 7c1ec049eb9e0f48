#pragma once

#include <cstddef>

#include <boost/function.hpp>

struct inotify_event;

namespace MARU {
namespace Backup {

/** Room for ten events that carry the longest name. */
constexpr std::size_t INOTIFY_BUFFER_SIZE = 10 * (16 + 256);

/**
 * Calls `handler` for each event in the `size` bytes that were read into
 * `buffer`. An event that was cut at the end is handed on as far as it goes:
 * what is missing reads as zero, and its `len` never reaches out of the event.
 */
void walkInotifyEvents(const char* buffer, std::size_t size, const boost::function<void(inotify_event*)>& handler);

} // namespace Backup
} // namespace MARU
