#pragma once

#include <ctime>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <marubackup-util/session.h>

#include "support/session_areas.h"
#include "support/syslog_socket.h"

/** A lifetime that ends long after every test. */
const long LONG_TIME = 100000;

/** Sessions in a /tmp of their own, with syslog at hand. */
class TimedSessionTest : public testing::Test {
protected:
    /** Makes a session whose object is gone; its directory was changed that long ago. */
    struct Made {
        std::string id;
        std::string path;
    };
    static Made makeSession();

    /** Makes a file in the session, with a content, that was read at that time and changed just now. */
    static std::string addFile(const std::string& path, time_t lastReading);

    static void expectKept(const Made& session);
    static void expectDestroyed(const Made& session);

    /** The errors that were logged so far are these, in that order, and all of them the unit's own. */
    void expectErrors(const std::vector<std::string>& texts);

    support::SessionAreas areas;
    support::SyslogSocket log;
};

/**
 * Has `body` work with the current time as its argument, and again if the clock
 * has gone on to another second meanwhile; its last result.
 */
template <typename Body>
long withinOneSecond(Body body) {
    while (true) {
        const time_t now = time(nullptr);
        const long result = body(now);
        if (time(nullptr) == now) {
            return result;
        }
    }
}
