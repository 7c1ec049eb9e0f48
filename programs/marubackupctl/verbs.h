#pragma once

#include <optional>
#include <string>
#include <vector>

#include <json/value.h>

#include <marubackup/job.h>

using MARU::Backup::Job;

/** What holds for every verb. */
struct Globals {
    /** Data on standard output is JSON. */
    bool json = false;
    /** The longest that one exchange with the daemon may take, in seconds. */
    double timeout = 10;
};

// The verbs: what each was given on the command line, and what it does. A run
// function returns the exit status.

struct AddVerb {
    std::string backend;
    std::string action;
    std::string branch;
    Json::Value parameters = Json::Value(Json::objectValue);
};
int run(const AddVerb& verb, const Globals& globals);

struct ListVerb {
    // Each empty: no such filter.
    std::string action;
    std::string backend;
    std::string unique;
    std::string format;
    std::string target;
};
int run(const ListVerb& verb, const Globals& globals);

struct ShowVerb {
    int jobId = 0;
};
int run(const ShowVerb& verb, const Globals& globals);

struct RemoveVerb {
    std::vector<int> jobIds;
};
int run(const RemoveVerb& verb, const Globals& globals);

struct WaitVerb {
    std::vector<int> jobIds;
    /** The longest that the whole wait may take, in seconds. */
    std::optional<double> longest;
};
int run(const WaitVerb& verb, const Globals& globals);

struct BackendsVerb {};
int run(const BackendsVerb& verb, const Globals& globals);

struct StatusVerb {
    /** The one whose work is asked about; empty: all. */
    std::string backend;
};
int run(const StatusVerb& verb, const Globals& globals);

struct SessionCreateVerb {
    long lifetime = 0;
    bool onMaxVolume = false;
};
int run(const SessionCreateVerb& verb, const Globals& globals);

struct SessionPathVerb {
    std::string id;
};
int run(const SessionPathVerb& verb, const Globals& globals);

struct SessionDestroyVerb {
    std::string id;
};
int run(const SessionDestroyVerb& verb, const Globals& globals);

struct SessionExpireVerb {
    std::string id;
    long lifetime = 0;
    bool walkFiles = true;
};
int run(const SessionExpireVerb& verb, const Globals& globals);

struct ArchiveVersionGetVerb {
    std::string path;
};
int run(const ArchiveVersionGetVerb& verb, const Globals& globals);

struct ArchiveVersionFsGetVerb {
    std::string path;
};
int run(const ArchiveVersionFsGetVerb& verb, const Globals& globals);

struct ArchiveVersionFsIncreaseVerb {
    std::string path;
};
int run(const ArchiveVersionFsIncreaseVerb& verb, const Globals& globals);
