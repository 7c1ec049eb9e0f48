#include <marubackup/backend_manager.h>

#include <dirent.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <new>

#include <json/value.h>

#include <marubackup-util/option_map.h>
#include <marubackup-util/path.h>
#include <marubackup-util/sub_process.h>
#include <marubackup/job.h>

#include "backend/start_launch.h"
#include "common/json_text.h"
#include "common/log.h"

namespace MARU {
namespace Backup {

class BackendManagerPrivate {
public:
    bool loaded = false;
    OptionMap options;

    /** Whether there is a section to ask; reports it if not. */
    bool checkLoaded() const;
};

namespace {

const char* const LOG_UNIT = "backend_manager";

const char* const LOCAL_FOLDER = "/usr/local/share/marubackup";
const char* const SYSTEM_FOLDER = "/usr/maru/share/marubackup";
const std::string FILE_SUFFIX = ".conf";
const char* const DEFAULT_UNIQUE_FORMAT = "_job_id.{{job_id}}";
const int DEFAULT_PRIORITY = 5;

/** No client may point the daemon at a file outside the two folders. */
bool canBeFileName(const std::string& backend) {
    return backend.find('/') == std::string::npos && backend.find('\0') == std::string::npos;
}

std::string configPath(const std::string& backend) {
    const std::string local = Path::join(LOCAL_FOLDER, backend + FILE_SUFFIX);
    return access(local.c_str(), R_OK) == 0 ? local : Path::join(SYSTEM_FOLDER, backend + FILE_SUFFIX);
}

bool formatCommand(std::list<std::string>& command, const Job& job) {
    for (std::string& element : command) {
        element = job.toFormatString(element);
    }
    return true;
}

bool applyBackendEnv(SubProcess& process, const OptionMap& options, const Job& job) {
    std::string text;
    if (!options.optGet("eviron", text, false)) {
        return true;
    }
    Json::Value variables;
    // The key's spelling and this test are what the installed backends were
    // written for: variables come only from a text that fails to parse and
    // still leaves an object, and a well-formed object is a bad environment.
    const bool parsed = fromString(text, variables);
    if (parsed || !variables.isObject()) {
        LOG_LOCATED_ERR("wrong config: bad env");
        return false;
    }
    for (const std::string& name : variables.getMemberNames()) {
        const Json::Value& value = variables[name];
        if (hasTextForm(value)) {
            process.setEnv(name, job.toFormatString(value.asString()));
        }
    }
    return true;
}

std::string launchKey(const Job& job) {
    const std::string branch = job.getCommandBranch();
    return "command_" + (branch.empty() ? "launch" : branch);
}

void applyOutputFiles(SubProcess& process, const OptionMap& options, const Job& job) {
    std::string output;
    if (options.optGet("pipe_stdout", output, false)) {
        process.setStdOutput(job.toFormatString(output), 0);
    }
    if (options.optGet("pipe_stderr", output, false)) {
        process.setStdError(job.toFormatString(output), 0);
    }
}

int launchPriority(const OptionMap& options) {
    int priority = DEFAULT_PRIORITY;
    options.optGet("priority", priority);
    return priority;
}

} // namespace

bool BackendManagerPrivate::checkLoaded() const {
    if (!loaded) {
        LOG_LOCATED_ERR("backend not loaded");
    }
    return loaded;
}

BackendManager::BackendManager() : d(new BackendManagerPrivate) {
}

BackendManager::~BackendManager() {
    delete d;
}

bool BackendManager::load(const std::string& backend, const std::string& action) {
    const std::string path = configPath(backend);
    d->loaded = false;
    d->options.optClear();
    if (!canBeFileName(backend) || !d->options.optSectionLoad(path, action, -1)) {
        LOG_LOCATED_DEBUG("load backend [%s] action [%s] from [%s] failed", backend.c_str(), action.c_str(),
                          path.c_str());
        return false;
    }
    d->loaded = true;
    return true;
}

bool BackendManager::listBackend(std::list<std::string>& backends) {
    backends.clear();
    DIR* const opened = opendir(SYSTEM_FOLDER);
    if (opened == nullptr) {
        return errno == ENOENT;
    }
    const std::shared_ptr<DIR> folder(opened, closedir);
    while (const dirent* entry = readdir(folder.get())) {
        const std::string name = entry->d_name;
        // Shorter ones, "a.conf" among them, have never been listed, and
        // applications show what is.
        if (name.size() <= FILE_SUFFIX.size() + 1) {
            continue;
        }
        const std::size_t stem = name.size() - FILE_SUFFIX.size();
        if (name.compare(stem, std::string::npos, FILE_SUFFIX) == 0) {
            backends.push_back(name.substr(0, stem));
        }
    }
    return true;
}

bool BackendManager::isDelegate() const {
    if (!d->checkLoaded()) {
        return false;
    }
    std::string value;
    return d->options.optGet("delegate", value, false);
}

std::string BackendManager::getUniqueFormat() const {
    if (!d->checkLoaded()) {
        return std::string();
    }
    std::string format;
    return d->options.optGet("unique", format, false) ? format : DEFAULT_UNIQUE_FORMAT;
}

std::string BackendManager::getJobUnique(const Job& job) const {
    const std::string format = getUniqueFormat();
    return format.empty() ? format : job.toFormatString(format);
}

bool BackendManager::check(const Job& job) const {
    if (!d->checkLoaded()) {
        return false;
    }
    std::list<std::string> command;
    if (!d->options.optGet("command_check", command)) {
        return true;
    }
    formatCommand(command, job);
    SubProcess process(command);
    applyBackendEnv(process, d->options, job);
    const int status = process.call();
    return status >= 0 && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

bool BackendManager::launch(const Job& job) const {
    if (!d->checkLoaded()) {
        return false;
    }
    std::list<std::string> command;
    if (!d->options.optGet(launchKey(job), command)) {
        LOG_LOCATED_ERR("wrong config: launch command not found");
        return false;
    }
    formatCommand(command, job);
    SubProcess process(command);
    applyBackendEnv(process, d->options, job);
    applyOutputFiles(process, d->options, job);
    setpriority(PRIO_PROCESS, static_cast<id_t>(getpid()), launchPriority(d->options));
    return process.exec() != 0;
}

#ifdef MARUBACKUP_SUB_PROCESS_WITHOUT_START

int startLaunch(const BackendManager&, const Job&) {
    return -1;
}

#else

int startLaunch(const BackendManager& backend, const Job& job) {
    const OptionMap& options = backend.d->options;
    std::list<std::string> command;
    std::string environment;
    if (!backend.d->loaded || !options.optGet(launchKey(job), command) ||
        options.optGet("eviron", environment, false)) {
        return -1; // launch() has, or may have, something to log
    }
    try {
        formatCommand(command, job);
        SubProcess process(command);
        applyOutputFiles(process, options, job);
        return process.start(launchPriority(options));
    } catch (const std::bad_alloc&) {
        return -1; // at worst that child's end, and never the caller's
    }
}

#endif

} // namespace Backup
} // namespace MARU
