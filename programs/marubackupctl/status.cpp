#include <functional>
#include <vector>

#include <marubackup/system_status.h>

#include "daemon.h"
#include "output.h"
#include "shared/daemon_socket.h"
#include "table.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::System;

namespace {

/** Why something may not start: a name for programs, and words for people. */
struct Reason {
    Job::Action action;
    const char* name;
    const char* words;
};

const Reason REASONS[] = {
    {Job::ACTION_BACKUP, "backup", "a backup runs or is queued"},
    {Job::ACTION_RESTORE, "restore", "a restore runs or is queued"},
    {Job::ACTION_COPY_TO, "copy_to", "a copy-to runs or is queued"},
    {Job::ACTION_SHARE_SNAPSHOT_RESTORE, "share_snapshot_restore", "a snapshot of a shared folder is being restored"},
    {Job::ACTION_SPACE_BUILD, "space_build", "a storage space is being built"},
};

const Reason* reasonOf(Job::Action action) {
    for (const Reason& reason : REASONS) {
        if (reason.action == action) {
            return &reason;
        }
    }
    return nullptr;
}

/** A question with its answer. */
struct Predicate {
    const char* name;
    const char* words;
    std::function<bool(Job::Action& reason)> ask;
    bool answer = false;
    Job::Action reason = Job::ACTION_NONE;
};

/** The questions; `backend` is the one whose work is asked about. */
std::vector<Predicate> predicatesOn(const std::string& backend) {
    using Ask = bool (*)(Job::Action&);
    const auto of = [&backend](bool (*isAtWork)(const std::string&)) {
        return [isAtWork, backend](Job::Action&) { return isAtWork(backend); };
    };
    return {
        {"can_backup", "a backup may start", Ask(System::canBackup)},
        {"can_restore", "a restore may start", Ask(System::canRestore)},
        {"can_copy_to", "a copy-to may start", Ask(System::canCopyTo)},
        {"can_queue_copy_to", "a copy-to may be queued", [](Job::Action&) { return System::canCopyTo(); }},
        {"backup_running", "a backup runs or is queued", of(System::isBackupRunning)},
        {"restore_running", "a restore runs or is queued", of(System::isRestoreRunning)},
        {"copy_to_running", "a copy-to runs or is queued", of(System::isCopyToRunning)},
        {"backup_running_not_queued", "a backup runs outside of the queue", of(System::isBackupRunningNotQueued)},
        {"restore_running_not_queued", "a restore runs outside of the queue", of(System::isRestoreRunningNotQueued)},
        {"copy_to_running_not_queued", "a copy-to runs outside of the queue", of(System::isCopyToRunningNotQueued)},
    };
}

std::string asTable(const std::vector<Predicate>& predicates) {
    Table table({"WHETHER", "ANSWER", "BECAUSE"});
    for (const Predicate& predicate : predicates) {
        const Reason* const reason = reasonOf(predicate.reason);
        table.add({predicate.words, predicate.answer ? "yes" : "no", reason != nullptr ? reason->words : ""});
    }
    return table.text();
}

std::string asJson(const std::vector<Predicate>& predicates) {
    Json::Value object(Json::objectValue);
    for (const Predicate& predicate : predicates) {
        Json::Value& entry = object[predicate.name];
        entry["answer"] = predicate.answer;
        if (const Reason* const reason = reasonOf(predicate.reason)) {
            entry["reason"] = reason->name;
            entry["words"] = reason->words;
        }
    }
    return toLine(object) + "\n";
}

} // namespace

int run(const StatusVerb& verb, const Globals& globals) {
    const bool served = isDaemonThere();
    std::vector<Predicate> predicates = predicatesOn(verb.backend);
    for (Predicate& predicate : predicates) {
        askLibrary([&predicate] { predicate.answer = predicate.ask(predicate.reason); }, globals);
    }
    if (served && !isDaemonThere()) {
        return reportFailure(CODE_NOT_REACHABLE, "the daemon ended meanwhile", globals);
    }
    if (!served) {
        say("nobody answers at " MARUBACKUP_SOCKET ": no job is known of");
    }
    putData(globals.json ? asJson(predicates) : asTable(predicates));
    return EXIT_DONE;
}
