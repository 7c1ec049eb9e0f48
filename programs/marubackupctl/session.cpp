#include <marubackup/timed_session.h>

#include "daemon.h"
#include "output.h"
#include "shared/daemon_socket.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::TimedSession;

namespace {

Json::Value withId(const std::string& id) {
    Json::Value json(Json::objectValue);
    json["sess_id"] = id;
    return json;
}

void putSession(const TimedSession& session, const std::string& line, const Globals& globals) {
    Json::Value json = withId(session.getId());
    json["path"] = session.getPath();
    putData((globals.json ? toLine(json) : line) + "\n");
}

/** Makes `session` the one of that id; false, and the user is told, if there is none. */
bool find(TimedSession& session, const std::string& id) {
    const bool found = session.load(id);
    if (!found) {
        say("session " + printable(id) + ": there is none of that id, or it is not yours to see");
    }
    return found;
}

} // namespace

int run(const SessionCreateVerb& verb, const Globals& globals) {
    const TimedSession::TempType type = verb.onMaxVolume ? TimedSession::TEMP_MAX_VOLUME : TimedSession::TEMP_DEFAULT;
    TimedSession session;
    bool created = false;
    askLibrary([&] { created = session.create(type, verb.lifetime); }, globals);
    if (created) {
        putSession(session, session.getId(), globals);
        return EXIT_DONE;
    }
    if (session.getId().empty()) {
        say("cannot make a session: only root can, and there has to be room for it");
        return EXIT_OTHER;
    }
    // Nobody would ever remove it.
    session.destroy();
    return reportFailure(isDaemonThere() ? CODE_UNREADABLE : CODE_NOT_REACHABLE,
                         "no session, since the daemon does not take on its removal", globals);
}

int run(const SessionPathVerb& verb, const Globals& globals) {
    TimedSession session;
    if (!find(session, verb.id)) {
        return EXIT_NO_SUCH_THING;
    }
    putSession(session, session.getPath(), globals);
    return EXIT_DONE;
}

int run(const SessionDestroyVerb& verb, const Globals&) {
    TimedSession session;
    if (!find(session, verb.id)) {
        return EXIT_NO_SUCH_THING;
    }
    const std::string path = session.getPath();
    if (!session.destroy()) {
        say("session " + verb.id + ": something of " + path + " cannot be removed; see what is mounted there");
        return EXIT_OTHER;
    }
    return EXIT_DONE;
}

int run(const SessionExpireVerb& verb, const Globals& globals) {
    const long left = TimedSession::destroyExpired(verb.id, verb.lifetime, verb.walkFiles);
    if (left < 0) {
        say("session " + printable(verb.id) + ": cannot be removed; the reason is in the system log");
        return EXIT_OTHER;
    }
    Json::Value json = withId(verb.id);
    json["seconds_left"] = Json::Value::Int64(left);
    putData((globals.json ? toLine(json) : std::to_string(left)) + "\n");
    return EXIT_DONE;
}
