#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <optional>
#include <vector>

#include "support/waiting.h"

namespace support {

/**
 * What has come in from somewhere, in order. One thread puts it there, another
 * looks for it and waits for it. An item that a wait has found is not found by
 * another one.
 */
template <typename Item>
class Inbox {
public:
    void put(const Item& item) {
        const std::lock_guard<std::mutex> lock(mutex);
        items.push_back(item);
        found.push_back(false);
        arrived.notify_all();
    }

    /** Waits for an item that `matches`; none if it does not come. */
    std::optional<Item> waitFor(const std::function<bool(const Item&)>& matches) {
        std::unique_lock<std::mutex> lock(mutex);
        const auto end = std::chrono::steady_clock::now() + PATIENCE;
        std::size_t at = 0;
        do {
            for (; at < items.size(); ++at) {
                if (!found[at] && matches(items[at])) {
                    found[at] = true;
                    return items[at];
                }
            }
        } while (arrived.wait_until(lock, end) == std::cv_status::no_timeout);
        return std::nullopt;
    }

    std::vector<Item> all() {
        const std::lock_guard<std::mutex> lock(mutex);
        return items;
    }

private:
    std::mutex mutex;
    std::condition_variable arrived;
    std::vector<Item> items;
    std::vector<bool> found;
};

} // namespace support
